#include "dataset/mira_dataset.h"

#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "paths.h"

#include <algorithm>
#include <stdexcept>
#include <string_view>
#include <utility>

#include <err.h>

mira_dataset::mira_dataset(const std::string& path) : path_(path) {
    create_components();
}

void mira_dataset::create_components() {
    constexpr std::string_view root = paths::dataset_root;

    auto zoneinfo = std::make_shared<mira_zoneinfo>(path_);
    if (path_.empty()) {
        version_string_ = zoneinfo->version_string() + ".1.0";
    } else if (path_.starts_with(root) && path_.size() > root.size()) {
        version_string_ = path_.substr(root.size());
    } else {
        warn("mira_dataset::create_components: bad path %s", path_.c_str());
        throw std::invalid_argument("badpath");
    }
    version_.parse(version_string_);
    components_.push_back(std::move(zoneinfo));
    components_.push_back(std::make_shared<mira_icu>(path_));
}

bool mira_dataset::compatible_schema(const mira_dataset& other) const {
    return std::equal(components_.begin(), components_.end(), other.components_.begin(),
        other.components_.end(),
        [](const auto& mine, const auto& theirs) { return mine->compatible_schema(*theirs); });
}

void mira_dataset::make_current() const {
    for (const auto& component : components_) {
        component->make_current();
    }
}
