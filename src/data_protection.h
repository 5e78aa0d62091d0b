#pragma once

#include <fcntl.h>

/// The target's data protection: a file or directory belongs to a numbered protection class, which
/// says when its content can be read.
///
/// The build looks for both names in the host's <fcntl.h> and uses them as they are where it finds
/// them. Elsewhere this header stands in their place. A port to a host that has data protection
/// under other names has to provide
/// - `F_SETPROTECTIONCLASS`, a command for `fcntl` whose argument is the class that the open file
///   or directory is put into. Its failure is ignored, so a host without data protection needs
///   only a number that its `fcntl` refuses;
/// - `open_dprotected_np`, as defined below.

#ifndef MIRA_HAVE_F_SETPROTECTIONCLASS
inline constexpr int F_SETPROTECTIONCLASS = 64;
#endif

#ifndef MIRA_HAVE_OPEN_DPROTECTED_NP
/// Opens `path` as `open` does with `flags` and `permissions`; where it creates the file, that
/// belongs to `protection_class`. Returns the descriptor, or -1 with `errno` set. Here the class
/// and the protection options have no effect.
inline int open_dprotected_np(const char* path, int flags, int /*protection_class*/,
    int /*protection_options*/, int permissions) {
    return ::open(path, flags, permissions);
}
#endif

/// The class of what the system keeps in its time-zone directories.
inline constexpr int timezone_protection_class = 4;
