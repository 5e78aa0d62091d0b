#pragma once

#include <cerrno>
#include <string>

#include <gtest/gtest.h>

/// Returns what `action` writes to standard error while no call fails.
template <typename Action>
std::string warnings(Action action) {
    testing::internal::CaptureStderr();
    errno = 0;
    action();
    return testing::internal::GetCapturedStderr();
}

/// Returns the line that `text` makes as a warning, with the text of `error`.
inline std::string warning(const std::string& text, int error = 0) {
    return std::string(::program_invocation_short_name) + ": " + text + ": " + ::strerror(error) +
           "\n";
}
