#pragma once

#include <string>

/// Returns the text of the latest link, "/var/db/timezone/tz_latest", unexamined: the directory of
/// the newest installed dataset. Empty when nothing exists there.
/// Throws what `fsutil::read_symlink` throws, after its warning.
std::string read_latest_link();

/// Returns the directory of the current dataset, the one that the zoneinfo link
/// "/var/db/timezone/zoneinfo" points into; empty for the system dataset.
/// Throws what `fsutil::read_symlink` throws, and what `dataset_path_from_zoneinfo_link` throws: a
/// missing link is a bad one, with an empty text.
std::string read_current_link();

/// Returns the directory of the dataset that a zoneinfo link with the text `text` points into: the
/// text up to its last slash, when that leaves a directory below "/var/db/timezone/tz/", or the
/// empty path for "/usr/share/zoneinfo.default".
/// Any other text warns "Bad zoneinfo link %s" and throws the `int` -1.
std::string dataset_path_from_zoneinfo_link(const std::string& text);
