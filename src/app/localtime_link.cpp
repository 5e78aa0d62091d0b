#include "app/localtime_link.h"

#include "fsutil/fsutil.h"
#include "paths.h"

#include <cstdio>
#include <string>
#include <string_view>

#include <err.h>

namespace {

constexpr char default_zone[] = "America/Los_Angeles";

void replace_localtime_link(const std::string& target) {
    // std::remove also deletes an empty directory, and reports nothing. An entry that stays makes
    // create_symlink fail, which reports it.
    std::remove(paths::localtime_link);
    fsutil::create_symlink(target, paths::localtime_link);
}

/// Throws when the link can be neither kept nor corrected: the `int` -1 without a warning of its
/// own, or what the link operations throw, after their warning.
void keep_or_correct_localtime_link() {
    constexpr int invalid_link = -1;
    constexpr std::string_view correctable = paths::correctable_zoneinfo;

    const std::string zone_path = fsutil::read_symlink(paths::localtime_link);
    if (zone_path.starts_with(paths::zoneinfo_link)) {
        return;
    }
    if (!zone_path.starts_with(correctable)) {
        throw invalid_link;
    }
    const std::string corrected = paths::zoneinfo_link + zone_path.substr(correctable.size());
    // Written before the check, so that a correction that fails is reported too.
    warn("Correcting localtime link to %s", corrected.c_str());
    if (!fsutil::exists(corrected)) {
        throw invalid_link;
    }
    replace_localtime_link(corrected);
}

} // namespace

void repair_localtime_link() {
    try {
        keep_or_correct_localtime_link();
    } catch (...) {
        warn("localtime link invalid; resetting to %s", default_zone);
        replace_localtime_link(paths::default_localtime);
    }
}
