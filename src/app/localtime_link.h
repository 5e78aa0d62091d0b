#pragma once

/// Makes sure that the local-time link names a zone through the zoneinfo link, so that the local
/// time follows every change of dataset.
///
/// A link that does is left alone, whether or not its zone exists. A link into
/// "/usr/share/zoneinfo" is corrected to the same zone below the zoneinfo link ("Correcting
/// localtime link to %s"). Any other link, a missing one and one that cannot be read or corrected
/// are replaced by the default zone, America/Los_Angeles ("localtime link invalid; resetting to
/// %s"). Only the first bytes of a text are compared, as stored: nothing is resolved.
///
/// Throws, with the warning of `fsutil::create_symlink` written, only when even the default link
/// cannot be created.
void repair_localtime_link();
