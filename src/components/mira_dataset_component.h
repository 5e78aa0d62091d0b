#pragma once

#include <string>
#include <utility>

/// One kind of time-zone data inside a dataset. A component reads what it needs to know of its data
/// while it is built and does not change afterwards.
///
/// The destructor is not virtual and not public: a component is made with `std::make_shared` of its
/// own class, whose deleter knows that class, and deleting one through the base does not compile.
class mira_dataset_component {
public:
    /// Returns whether this component's data has a format that readers of `other`'s data can read.
    virtual bool compatible_schema(const mira_dataset_component& other) const = 0;

    /// Puts the system-wide link for this kind of data in order: removes the old one, then creates
    /// the one that this component's data wants.
    /// Throws what `fsutil::create_symlink` throws, after its warning.
    virtual void make_current() const = 0;

protected:
    explicit mira_dataset_component(std::string dataset_path = {})
        : dataset_path_(std::move(dataset_path)) {}
    ~mira_dataset_component() = default;

    /// The directory of the dataset; empty for the system dataset.
    const std::string& dataset_path() const { return dataset_path_; }

private:
    std::string dataset_path_;
};
