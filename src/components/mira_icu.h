#pragma once

#include "components/mira_dataset_component.h"

#include <string>

/// ICU time-zone data: "/usr/share/icu" in the system dataset, the subdirectory "icutz" of an
/// updated dataset. Its format is the first word of the system's "icutzformat.txt", unchecked; in
/// an update it is part of a data file's name, a number and one of the letters l, b and e: 44l in
/// "icutz44l.dat".
class mira_icu final : public mira_dataset_component {
public:
    /// Builds the component of the dataset in the directory `dataset_path`; the empty path is the
    /// system dataset. Data that is missing or cannot be read is no failure: the format is empty.
    /// Throws the `errno` as an `int` when `fts_open` fails on the directory of an updated dataset,
    /// after the warning "tz_icu::initialize: fts_open of %s failed, %s".
    explicit mira_icu(const std::string& dataset_path = {});

    /// Returns whether `other` is ICU data of the same format; two empty formats are the same. For
    /// a component of another kind, warns "mira_icu::compatible_schema: could not dynamic_cast
    /// other component" and returns false.
    bool compatible_schema(const mira_dataset_component& other) const override;

    /// Points "/var/db/icutz" at the data of an updated dataset; for the system dataset, removes
    /// it. When the old link cannot be removed, warns "unlink of ICU softlink failed", after the
    /// warning of `fsutil::remove`, and goes on.
    void make_current() const override;

private:
    void initialize();
    void find_format();

    /// Compared as text only. Empty when unknown.
    std::string format_;
    std::string icu_path_;
};
