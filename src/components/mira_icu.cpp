#include "components/mira_icu.h"

#include "fsutil/fsutil.h"
#include "paths.h"

#include <cerrno>
#include <cstring>
#include <ctime>
#include <fstream>
#include <memory>
#include <regex>

#include <err.h>
#include <fts.h>
#include <sys/stat.h>

namespace {

struct walk_closer {
    void operator()(FTS* walk) const { ::fts_close(walk); }
};
using file_walk = std::unique_ptr<FTS, walk_closer>;

/// With a 32-bit `long`, the GNU C library's walk fails to read a directory dated past 2038, unless
/// it stays in the working directory.
constexpr int stay_in_place = sizeof(long) < sizeof(std::time_t) ? FTS_NOCHDIR : 0;

/// Opens a walk that follows no link except `root` itself and does not leave its file system.
/// Entries come in the order in which the file system lists them.
file_walk open_walk(std::string root) {
    char* const roots[] = {root.data(), nullptr};
    constexpr int options = FTS_COMFOLLOW | FTS_PHYSICAL | FTS_XDEV | stay_in_place;
    file_walk walk(::fts_open(roots, options, nullptr));
    if (walk == nullptr) {
        const int error = errno;
        warn("tz_icu::initialize: fts_open of %s failed, %s", root.c_str(), std::strerror(error));
        throw error;
    }
    return walk;
}

/// Returns whether the entry is a regular file directly inside the root with read permission for
/// others.
bool may_be_data_file(const FTSENT& entry) {
    return entry.fts_errno == 0 && entry.fts_level == 1 && entry.fts_namelen != 0 &&
           entry.fts_info == FTS_F && (entry.fts_statp->st_mode & S_IROTH) != 0;
}

} // namespace

mira_icu::mira_icu(const std::string& dataset_path)
    : mira_dataset_component(dataset_path),
      icu_path_(dataset_path.empty() ? paths::system_icu : dataset_path + "/icutz") {
    initialize();
}

void mira_icu::initialize() {
    if (dataset_path().empty()) {
        std::ifstream file(icu_path_ + "/icutzformat.txt");
        file >> format_;
    } else {
        find_format();
    }
}

/// Takes the format from the name of the first data file that the walk finds. Only names in the
/// directory itself count, but when none does, the walk visits the whole tree below it.
void mira_icu::find_format() {
    // Over wide characters for the reason given in mira_version.cpp.
    const std::wregex data_file_name(LR"(icutz([0-9]+[lbe])\.dat)");
    const file_walk walk = open_walk(icu_path_);
    while (const FTSENT* const entry = ::fts_read(walk.get())) {
        if (may_be_data_file(*entry)) {
            const std::wstring name(entry->fts_name, entry->fts_name + entry->fts_namelen);
            std::wsmatch match;
            if (std::regex_match(name, match, data_file_name)) {
                format_.assign(match[1].first, match[1].second);
                return;
            }
        }
    }
}

bool mira_icu::compatible_schema(const mira_dataset_component& other) const {
    const auto* const other_icu = dynamic_cast<const mira_icu*>(&other);
    if (other_icu == nullptr) {
        warn("mira_icu::compatible_schema: could not dynamic_cast other component");
        return false;
    }
    return format_ == other_icu->format_;
}

void mira_icu::make_current() const {
    try {
        fsutil::remove(paths::icu_link);
    } catch (...) {
        warn("unlink of ICU softlink failed");
    }
    if (!dataset_path().empty()) {
        fsutil::create_symlink(icu_path_, paths::icu_link);
    }
}
