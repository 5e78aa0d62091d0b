#pragma once

#include "support/device.h"

#include <functional>
#include <string>

/// Starts the built program on the device and checks that it ends with `status`, writes nothing on
/// standard output, and writes the warnings `expected`. `prepare` is called in the child first.
void check_start(
    const strings& expected = {}, int status = 0, const std::function<void()>& prepare = {}
);

/// A system call of the program's, as it is entered.
struct system_call {
    long number;
    unsigned long arguments[6];
    /// Those of its arguments that are paths of the device, each with a blank before it.
    std::string paths;
};

/// What becomes of a system call: 0 lets it pass, an errno makes it fail without being done, and
/// `kill_before` kills the program before it is done.
using judge = std::function<int(const system_call&)>;
constexpr int kill_before = -1;

/// Whether this machine is one on which `trace_start` can make calls fail.
extern const bool can_fail_calls;

/// Starts the program with `decide` asked about each of its system calls, and returns its status as
/// `waitpid` gives it. What it writes is not checked.
int trace_start(const judge& decide);
