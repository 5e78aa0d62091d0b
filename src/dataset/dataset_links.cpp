#include "dataset/dataset_links.h"

#include "fsutil/fsutil.h"
#include "paths.h"

#include <cstddef>
#include <string_view>

#include <err.h>

namespace {

std::string dataset_path_from_zoneinfo_link(const std::string& text) {
    constexpr std::string_view root = paths::dataset_root;
    constexpr int bad_link = -1;

    if (text.starts_with(root)) {
        // With a last slash in or right after the root, the dataset would have no name.
        const std::size_t last_slash = text.rfind('/');
        if (last_slash > root.size()) {
            return text.substr(0, last_slash);
        }
    } else if (text == paths::system_zoneinfo) {
        return {};
    }
    warn("Bad zoneinfo link %s", text.c_str());
    throw bad_link;
}

} // namespace

std::string read_latest_link() {
    return fsutil::read_symlink(paths::latest_link);
}

std::string read_current_link() {
    return dataset_path_from_zoneinfo_link(fsutil::read_symlink(paths::zoneinfo_link));
}
