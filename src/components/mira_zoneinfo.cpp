#include "components/mira_zoneinfo.h"

#include "fsutil/fsutil.h"
#include "paths.h"

#include <fstream>

#include <err.h>

mira_zoneinfo::mira_zoneinfo(const std::string& dataset_path)
    : mira_dataset_component(dataset_path),
      zoneinfo_path_(dataset_path.empty() ? paths::system_zoneinfo : dataset_path + "/zoneinfo") {
    read_version();
}

void mira_zoneinfo::read_version() {
    std::ifstream file(zoneinfo_path_ + "/+VERSION");
    file >> version_string_;
}

bool mira_zoneinfo::compatible_schema(const mira_dataset_component& /*other*/) const {
    return true;
}

void mira_zoneinfo::make_current() const {
    try {
        fsutil::remove(paths::zoneinfo_link);
    } catch (...) {
        warn("Unlink of zoneinfo softlink failed");
    }
    fsutil::create_symlink(zoneinfo_path_, paths::zoneinfo_link);
}
