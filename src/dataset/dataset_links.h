#pragma once

#include <string>

/// Returns the text of the latest link, "/var/db/timezone/tz_latest", unexamined: the directory of
/// the newest installed dataset. Empty when nothing exists there.
/// Throws what `fsutil::read_symlink` throws, after its warning.
std::string read_latest_link();

/// Returns the directory of the current dataset, the one that the zoneinfo link
/// "/var/db/timezone/zoneinfo" points into: the link's text up to its last slash, when that leaves
/// a directory below "/var/db/timezone/tz/", or the empty path, for the system dataset, when the
/// text is "/usr/share/zoneinfo.default".
/// Any other text, the empty one of a missing link too, warns "Bad zoneinfo link %s" and throws the
/// `int` -1. Throws what `fsutil::read_symlink` throws, after its warning.
std::string read_current_link();
