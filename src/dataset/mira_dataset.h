#pragma once

#include "components/mira_dataset_component.h"
#include "version/mira_version.h"

#include <memory>
#include <string>
#include <vector>

/// One installed set of time-zone data: a version and the components that hold the data, zoneinfo
/// before ICU. Building a dataset reads files and writes none; it does not change afterwards.
///
/// Datasets are equal by directory and ordered by version: two of the same version in different
/// directories are different, and neither is newer.
class mira_dataset {
public:
    /// Builds the dataset in the directory `path`, which must be named below "/var/db/timezone/tz/"
    /// but need not exist; its version text is the rest of the path. The empty path is the system
    /// dataset; its version text is that of its tree followed by ".1.0". A version text that cannot
    /// be parsed leaves the version unset, after the two warnings of `mira_version::parse`.
    /// Throws `std::invalid_argument` for any other path, after the warning
    /// "mira_dataset::create_components: bad path %s", and what `mira_version::parse` and the
    /// components throw.
    explicit mira_dataset(const std::string& path = {});

    const mira_version& version() const { return version_; }
    std::string version_string() const { return version_string_; }

    /// Returns whether the paths of both are equal, byte for byte.
    bool operator==(const mira_dataset& other) const { return path_ == other.path_; }

    /// Returns whether this dataset's version is strictly newer than `other`'s.
    bool newer_than(const mira_dataset& other) const {
        return version().newer_than(other.version());
    }

    /// Returns whether a system that reads `other`'s data can read this dataset's: as many
    /// components, and each compatible with `other`'s at its position.
    bool compatible_schema(const mira_dataset& other) const;

    /// Makes the components current in order.
    /// Throws what a component throws; the links of the components before it stay switched.
    void make_current() const;

private:
    void create_components();

    mira_version version_;
    std::string version_string_;
    std::string path_;
    std::vector<std::shared_ptr<mira_dataset_component>> components_;
};
