#pragma once

#include <compare>
#include <string>

/// A dataset's version, parsed from a text such as 2016f.1.0. The default is the unset version,
/// which is older than every parsed one.
struct mira_version {
    mira_version() = default;

    /// Parses `text`, with the warnings and exceptions of `parse`.
    explicit mira_version(const std::string& text);

    /// Sets all members from `text`: digits, lower-case letters, and up to two numbers, each after
    /// a full stop. Numbers are decimal, with leading zeros allowed; a missing number gives -1.
    /// For a text of another form, writes two warnings, "Cannot parse version string %s,
    /// results.size() = %d" and "Cannot parse version string %s", and leaves the version unset.
    /// Throws `std::out_of_range`, without a warning, for a number above 2147483647; the members
    /// before it then have their new values.
    void parse(const std::string& text);

    /// Returns whether this version is strictly newer than `other`.
    bool newer_than(const mira_version& other) const { return *this > other; }

    // The order of the members is the order of versions: the first that differs decides. Letters
    // compare byte for byte, a prefix before what it begins; an absent number comes before 0.
    int year = -1;
    std::string letters;
    int major = -1;
    int minor = -1;

    std::strong_ordering operator<=>(const mira_version& other) const = default;
};
