#pragma once

#include "components/mira_dataset_component.h"

#include <string>

/// A compiled tz database tree: "/usr/share/zoneinfo.default" in the system dataset, the
/// subdirectory "zoneinfo" of an updated dataset.
class mira_zoneinfo final : public mira_dataset_component {
public:
    /// Builds the component of the dataset in the directory `dataset_path`; the empty path is the
    /// system dataset. A missing tree is no failure: the version text is empty.
    explicit mira_zoneinfo(const std::string& dataset_path = {});

    /// Returns the tree's version text: the first word of its file "+VERSION", unchecked; empty
    /// when the file cannot be read or holds no word.
    std::string version_string() const { return version_string_; }

    /// Returns true for every other component: only the ICU data decides.
    bool compatible_schema(const mira_dataset_component& other) const override;

    /// Points "/var/db/timezone/zoneinfo" at the tree, which need not exist. When the old link
    /// cannot be removed, warns "Unlink of zoneinfo softlink failed", after the warning of
    /// `fsutil::remove`, and goes on.
    void make_current() const override;

private:
    void read_version();

    std::string zoneinfo_path_;
    std::string version_string_;
};
