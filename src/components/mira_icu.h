#pragma once

#include "components/mira_dataset_component.h"

#include <string>

/// ICU time-zone data: "/usr/share/icu" in the system dataset, the subdirectory "icutz" of an
/// updated dataset.
class mira_icu final : public mira_dataset_component {
public:
    /// Builds the component of the dataset in the directory `dataset_path`; the empty path is the
    /// system dataset. Data that is missing or cannot be read is no failure: the format is empty.
    /// Throws the `errno` as an `int` when the directory of an updated dataset cannot be walked at
    /// all, after the warning "tz_icu::initialize: fts_open of %s failed, %s".
    explicit mira_icu(const std::string& dataset_path = {});

    /// Returns whether `other` is ICU data of the same format; two unknown formats are the same.
    /// A component of another kind warns "mira_icu::compatible_schema: could not dynamic_cast other
    /// component" and is not compatible.
    bool compatible_schema(const mira_dataset_component& other) const override;

    /// Points "/var/db/icutz" at the data of an updated dataset; the system dataset has no such
    /// link. A link that cannot be removed warns "unlink of ICU softlink failed", after the warning
    /// of `fsutil::remove`, and the rest is done all the same.
    void make_current() const override;

private:
    void initialize();
    void read_system_format();
    void find_format();

    /// A number and one of the letters l, b and e, for example 44l; only ever compared. Empty when
    /// it is not known.
    std::string format_;
    std::string icu_path_;
};
