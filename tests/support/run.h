#pragma once

#include "support/device.h"

#include <functional>
#include <string>

/// Returns a warning with the text of the errno of the call that has just failed. A warning that is
/// expected without one may show any: what stands there is left over from an earlier call.
std::string failed(const std::string& warning, int error);
/// Returns the warnings about a version text that is refused.
strings refused(const std::string& version);
strings operator+(strings left, const strings& right);

/// What an action throws, beside an `int`.
constexpr int badpath = -2;
constexpr int out_of_range = -3;

/// Runs `action` in this process and checks its warnings, in order, and what it throws.
void check_action(
    const std::function<void()>& action, const strings& warnings = {}, int thrown = 0);

/// Starts the built program and checks that it ends with `status`, prints nothing and writes the
/// warnings. `prepare` runs in the child before it.
void check_start(
    const strings& warnings = {}, int status = 0, const std::function<void()>& prepare = {});

/// A system call that the program is about to make, with those of its arguments that name a file
/// of the device.
struct system_call {
    long number;
    unsigned long arguments[6];
    strings paths;
};

/// Says what becomes of a call: 0 lets it pass, an errno makes it fail without being done, and
/// `kill_before` ends the program by SIGKILL.
using judge = std::function<int(const system_call&)>;
constexpr int kill_before = -1;

/// Starts the program with `decide` asked about each of its system calls, checks its warnings where
/// any are given, and returns how it ended, as `waitpid` says it.
int trace_start(const judge& decide, const strings& warnings = {});
