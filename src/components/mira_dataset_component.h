#pragma once

#include <string>

/// One kind of time-zone data inside a dataset. A component reads its data's version or format when
/// it is built and does not change afterwards.
///
/// The destructor is neither virtual nor public: a component is made with `std::make_shared` of its
/// own class, whose deleter knows that class, and deleting one through the base does not compile.
class mira_dataset_component {
public:
    /// Returns whether a system that reads `other`'s data can read this component's.
    virtual bool compatible_schema(const mira_dataset_component& other) const = 0;

    /// Replaces the system-wide link to this kind of data: removes the old one, then creates one to
    /// this component's data, unless the system needs no link to it.
    /// Throws what `fsutil::create_symlink` throws, after its warning.
    virtual void make_current() const = 0;

protected:
    explicit mira_dataset_component(const std::string& dataset_path = {})
        : dataset_path_(dataset_path) {}
    ~mira_dataset_component() = default;

    /// The directory of the dataset; empty for the system dataset.
    const std::string& dataset_path() const { return dataset_path_; }

private:
    std::string dataset_path_;
};
