#pragma once

#include <string>

/// Returns the text of the latest link, "/var/db/timezone/tz_latest", unchecked; it should be the
/// directory of the newest installed dataset. Empty when nothing exists there.
/// Throws what `fsutil::read_symlink` throws, after its warning.
std::string read_latest_link();

/// Returns the directory of the current dataset, the one that the zoneinfo link
/// "/var/db/timezone/zoneinfo" points into: the link's text up to its last slash, when that leaves
/// a directory below "/var/db/timezone/tz/", or the empty path, for the system dataset, when the
/// text is "/usr/share/zoneinfo.default".
/// For any other text, or a missing link, warns "Bad zoneinfo link %s" and throws -1 as an `int`.
/// Throws what `fsutil::read_symlink` throws, after its warning.
std::string read_current_link();
