#pragma once

#include <fcntl.h>

/// The target's data protection: a file or directory belongs to a numbered protection class, which
/// determines when its content can be read. This header defines what the host's <fcntl.h> lacks.

#ifndef F_SETPROTECTIONCLASS
/// The command for `fcntl` that puts the open file or directory into the class given as argument.
inline constexpr int F_SETPROTECTIONCLASS = 64;
#endif

#ifndef MIRA_HAVE_OPEN_DPROTECTED_NP
/// Opens `path` as `open` does with `flags` and `permissions`; a file that it creates belongs to
/// `protection_class`. Returns the descriptor, or -1 with `errno` set. In this definition the class
/// and the protection options have no effect.
inline int open_dprotected_np(const char* path, int flags, int /*protection_class*/,
    int /*protection_options*/, int permissions) {
    return ::open(path, flags, permissions);
}
#endif

/// The class of the time-zone directories and of the clean-up marker.
inline constexpr int timezone_protection_class = 4;
