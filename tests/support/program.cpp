#include "support/program.h"

#include "support/observe.h"

#include <csignal>
#include <cstddef>
#include <cstdlib>

#include <fcntl.h>
#include <sys/ptrace.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>

namespace
{

/// Opened before the device covers "/var" and "/usr/share", where the build may lie.
const int program = ::open(MIRA_TZLINKS, O_PATH | O_CLOEXEC);

[[noreturn]] void execute(int output, int errors, const std::function<void()>& prepare = {})
{
    ::dup2(output, STDOUT_FILENO);
    ::dup2(errors, STDERR_FILENO);
    if (prepare) {
        prepare();
    }
    char name[] = "mira_tzlinks";
    char argument[] = "--ignored";
    char* const arguments[] = {name, argument, nullptr};
    ::fexecve(program, arguments, environ);
    ::_exit(127);
}

/// Returns the text at `address` in the stopped process, or an empty one; cut to 1,000 bytes.
std::string text_at(pid_t process, unsigned long address)
{
    const std::string memory = "/proc/" + std::to_string(process) + "/mem";
    const int file = ::open(memory.c_str(), O_RDONLY | O_CLOEXEC);
    char text[1001] = {};
    if (::pread(file, text, sizeof text - 1, static_cast<off_t>(address)) < 0) {
        text[0] = '\0';
    }
    ::close(file);
    return text;
}

system_call entered_call(pid_t process, const __ptrace_syscall_info& info)
{
    system_call call{static_cast<long>(info.entry.nr), {}, {}};
    for (int i = 0; i < 6; ++i) {
        call.arguments[i] = info.entry.args[i];
        const std::string text = text_at(process, call.arguments[i]);
        if (text.starts_with("/var/") || text.starts_with("/usr/share/")) {
            call.paths += " " + text;
        }
    }
    return call;
}

#ifdef __x86_64__
void set_register(pid_t process, std::size_t offset, long value)
{
    ::ptrace(PTRACE_POKEUSER, process, offset, value);
}
void set_call_number(pid_t process, long number)
{
    set_register(process, offsetof(user_regs_struct, orig_rax), number);
}
void set_call_result(pid_t process, long result)
{
    set_register(process, offsetof(user_regs_struct, rax), result);
}
#else
void set_call_number(pid_t, long) {}
void set_call_result(pid_t, long) {}
#endif

} // namespace

#ifdef __x86_64__
const bool can_fail_calls = true;
#else
const bool can_fail_calls = false;
#endif

void check_start(const strings& expected, int status, const std::function<void()>& prepare)
{
    const scratch_file output;
    const scratch_file errors;
    const pid_t child = ::fork();
    if (child == 0) {
        execute(output.descriptor(), errors.descriptor(), prepare);
    }
    int ended = 0;
    ::waitpid(child, &ended, 0);
    EXPECT_TRUE(WIFEXITED(ended)) << "signal " << WTERMSIG(ended);
    EXPECT_EQ(WEXITSTATUS(ended), status);
    EXPECT_EQ(output.content(), "");
    check_warnings("mira_tzlinks", errors.content(), expected);
}

int trace_start(const judge& decide)
{
    const scratch_file output;
    const pid_t child = ::fork();
    if (child == 0) {
        ::setenv("ASAN_OPTIONS", "detect_leaks=0", 1); // the leak check is a tracer itself
        ::ptrace(PTRACE_TRACEME, 0, 0, 0);
        ::raise(SIGSTOP);
        execute(output.descriptor(), output.descriptor());
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    ::ptrace(
        PTRACE_SETOPTIONS, child, 0, PTRACE_O_TRACESYSGOOD | PTRACE_O_TRACEEXEC | PTRACE_O_EXITKILL
    );
    bool executed = false;
    int failure = 0;
    int signal = 0;
    while (::ptrace(PTRACE_SYSCALL, child, 0, signal) == 0 &&
           ::waitpid(child, &status, 0) == child && WIFSTOPPED(status)) {
        signal = 0;
        __ptrace_syscall_info info{};
        if (status >> 8 == (SIGTRAP | PTRACE_EVENT_EXEC << 8)) {
            executed = true;
        } else if (WSTOPSIG(status) != (SIGTRAP | 0x80)) {
            signal = WSTOPSIG(status);
        } else if (executed && ::ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof info, &info) > 0) {
            if (info.op == PTRACE_SYSCALL_INFO_ENTRY) {
                failure = decide(entered_call(child, info));
                if (failure == kill_before) {
                    ::kill(child, SIGKILL);
                } else if (failure != 0) {
                    set_call_number(child, -1);
                }
            } else if (failure > 0) {
                set_call_result(child, -failure);
                failure = 0;
            }
        }
    }
    return status;
}
