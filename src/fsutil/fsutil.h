#pragma once

#include <string>

/// Operations on links and paths, each one system call.
///
/// All but `exists` report a failure by one warning, which names the operation and the path, and
/// then throw the `errno` of the system call as an `int`. A failed call changes nothing on disk.
namespace fsutil {

/// Removes the file or link at `path` (a link itself, never what it points at; never a directory).
/// A missing path is no failure.
/// Any other failure warns "remove: could not remove %s" and throws.
void remove(const std::string& path);

/// Returns whether something exists at `path`, with links followed: false for a dangling link and
/// for a path that cannot be examined. Writes no warning.
bool exists(const std::string& path) noexcept;

/// Returns the text of the link at `path`, unresolved and cut to its first 1,024 bytes; empty when
/// the path is missing.
/// Any other failure, such as a path that is no link, warns "read_symlink: %s" and throws.
std::string read_symlink(const std::string& path);

/// Creates a link at `link_path` with the text `target`, which need not exist.
/// Any failure, such as an entry that already exists at `link_path`, warns
/// "create_symlink: from %s to %s" (link path, then target) and throws.
void create_symlink(const std::string& target, const std::string& link_path);

} // namespace fsutil
