#include "support/run.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <stdexcept>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/ptrace.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

/// Opened before the device covers "/var" and "/usr/share", where the build may lie.
const int program = ::open(MIRA_TZLINKS, O_PATH | O_CLOEXEC);

int open_scratch() {
    return ::memfd_create("scratch", MFD_CLOEXEC);
}

std::string close_scratch(int scratch) {
    std::string content(static_cast<std::size_t>(::lseek(scratch, 0, SEEK_END)), '\0');
    EXPECT_EQ(::pread(scratch, content.data(), content.size(), 0), content.size());
    ::close(scratch);
    return content;
}

bool is_line_of(const std::string& warning, const std::string& line) {
    return line == warning || line.starts_with(warning + ": ");
}

void check_lines(const std::string& output, const std::string& name, const strings& warnings) {
    strings lines;
    std::istringstream stream(output);
    for (std::string line; std::getline(stream, line);) {
        EXPECT_TRUE(line.starts_with(name + ": ")) << line;
        lines.push_back(line.substr(std::min(line.size(), name.size() + 2)));
    }
    if (!std::equal(warnings.begin(), warnings.end(), lines.begin(), lines.end(), is_line_of)) {
        EXPECT_EQ(lines, warnings);
    }
}

#ifdef __x86_64__
constexpr std::size_t number_register = offsetof(user_regs_struct, orig_rax);
constexpr std::size_t result_register = offsetof(user_regs_struct, rax);
#else
#error "name the registers of a system call's number and result"
#endif

system_call entered_call(const __ptrace_syscall_info& info, int memory) {
    system_call call{static_cast<long>(info.entry.nr), {}, {}};
    for (int i = 0; i < 6; ++i) {
        char text[1001] = {};
        call.arguments[i] = info.entry.args[i];
        if (::pread(memory, text, 1000, static_cast<off_t>(info.entry.args[i])) > 0 &&
            (std::strncmp(text, "/var/", 5) == 0 || std::strncmp(text, "/usr/share/", 11) == 0)) {
            call.paths.emplace_back(text);
        }
    }
    return call;
}

/// Follows a child that waits to be traced until it ends, and returns how.
int trace(pid_t child, const judge& decide) {
    int status = 0;
    int memory = -1; // of the program, once it is executed
    int verdict = 0;
    ::waitpid(child, &status, 0);
    ::ptrace(PTRACE_SETOPTIONS, child, 0, PTRACE_O_TRACESYSGOOD | PTRACE_O_TRACEEXEC);
    while (verdict != kill_before && ::ptrace(PTRACE_SYSCALL, child, 0, 0) == 0 &&
           ::waitpid(child, &status, 0) == child && WIFSTOPPED(status)) {
        __ptrace_syscall_info info{};
        if (status >> 8 == (SIGTRAP | PTRACE_EVENT_EXEC << 8)) {
            memory = ::open(("/proc/" + std::to_string(child) + "/mem").c_str(), O_RDONLY);
        }
        ::ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof info, &info);
        if (memory != -1 && info.op == PTRACE_SYSCALL_INFO_ENTRY) {
            verdict = decide(entered_call(info, memory));
            if (verdict > 0) {
                ::ptrace(PTRACE_POKEUSER, child, number_register, -1L);
            }
        } else if (info.op == PTRACE_SYSCALL_INFO_EXIT && verdict > 0) {
            ::ptrace(PTRACE_POKEUSER, child, result_register, static_cast<long>(-verdict));
        }
    }
    if (verdict == kill_before) {
        ::kill(child, SIGKILL);
        ::waitpid(child, &status, 0);
    }
    ::close(memory);
    return status;
}

struct ended {
    int status = 0;
    std::string output;
    std::string errors;
};

ended run_program(const std::function<void()>& prepare, const judge& decide) {
    const int output = open_scratch();
    const int errors = open_scratch();
    const pid_t child = ::fork();
    if (child == 0) {
        if (decide) {
            ::setenv("ASAN_OPTIONS", "detect_leaks=0", 1); // the leak check is a tracer itself
            ::ptrace(PTRACE_TRACEME, 0, 0, 0);
            ::raise(SIGSTOP);
        }
        ::dup2(output, STDOUT_FILENO);
        ::dup2(errors, STDERR_FILENO);
        if (prepare) {
            prepare();
        }
        char name[] = "mira_tzlinks";
        char ignored[] = "--version";
        char* const arguments[] = {name, ignored, nullptr};
        ::fexecve(program, arguments, environ);
        ::_exit(127);
    }
    ended end;
    if (decide) {
        end.status = trace(child, decide);
    } else {
        ::waitpid(child, &end.status, 0);
    }
    end.output = close_scratch(output);
    end.errors = close_scratch(errors);
    return end;
}

} // namespace

std::string failed(const std::string& warning, int error) {
    return warning + ": " + std::strerror(error);
}

strings refused(const std::string& version) {
    const std::string warning = "Cannot parse version string " + version;
    return {warning + ", results.size() = 0", warning};
}

strings operator+(strings left, const strings& right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

void check_action(const std::function<void()>& action, const strings& warnings, int thrown) {
    const int errors = open_scratch();
    const int standard_error = ::dup(STDERR_FILENO);
    ::dup2(errors, STDERR_FILENO);
    int caught = 0;
    try {
        action();
    } catch (int error) {
        caught = error;
    } catch (const std::invalid_argument& error) {
        caught = std::strcmp(error.what(), "badpath") == 0 ? badpath : 0;
    } catch (const std::out_of_range&) {
        caught = out_of_range;
    }
    ::dup2(standard_error, STDERR_FILENO);
    ::close(standard_error);
    EXPECT_EQ(caught, thrown);
    check_lines(close_scratch(errors), program_invocation_short_name, warnings);
}

void check_start(const strings& warnings, int status, const std::function<void()>& prepare) {
    const ended end = run_program(prepare, {});
    EXPECT_TRUE(WIFEXITED(end.status)) << "signal " << WTERMSIG(end.status);
    EXPECT_EQ(WEXITSTATUS(end.status), status);
    EXPECT_EQ(end.output, "");
    check_lines(end.errors, "mira_tzlinks", warnings);
}

int trace_start(const judge& decide, const strings& warnings) {
    const ended end = run_program({}, decide);
    if (!warnings.empty()) {
        check_lines(end.errors, "mira_tzlinks", warnings);
    }
    return end.status;
}
