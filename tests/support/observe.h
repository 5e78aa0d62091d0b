#pragma once

#include "support/device.h"

#include <functional>
#include <string>

/// Returns what a warning's line says when the call that it reports failed with `error`.
std::string failed(const std::string& text, int error);

/// Checks the lines that `program` wrote on standard error, in order. An expected text without the
/// text of an errno stands for the warning with any errno: where no call has just failed, the
/// errno that a warning shows is left over from some earlier call.
void check_warnings(const std::string& program, const std::string& output, const strings& expected);

/// Runs `action` in this process and checks the warnings that it writes and what it throws: "int "
/// and the value, or the name of the standard exception and its text.
void check_action(
    const std::function<void()>& action, const strings& warnings = {},
    const std::string& thrown = {}
);

/// An anonymous file for a program's output.
class scratch_file
{
public:
    scratch_file();
    ~scratch_file();
    scratch_file(const scratch_file&) = delete;
    scratch_file& operator=(const scratch_file&) = delete;

    int descriptor() const { return descriptor_; }
    std::string content() const;

private:
    int descriptor_;
};
