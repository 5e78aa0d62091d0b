#pragma once

/// Makes "/var/db/timezone/localtime" name a zone through the zoneinfo link, so that the local time
/// follows every change of dataset. What is done depends on the first bytes of the link's text,
/// which is not resolved:
/// - "/var/db/timezone/zoneinfo": the link is kept, whether or not the zone exists.
/// - "/usr/share/zoneinfo": warns "Correcting localtime link to %s" and replaces these bytes by
///   "/var/db/timezone/zoneinfo", provided that the new path exists.
/// - Any other text, a missing link, or one that cannot be read or corrected: warns "localtime link
///   invalid; resetting to %s" and links the default zone, America/Los_Angeles, unchecked.
///
/// Throws what `fsutil::create_symlink` throws, after its warning, when the default link cannot be
/// created.
void repair_localtime_link();
