#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <csignal>
#include <string>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

const std::string given_up = "Symlink points at data incompatible with installed system";
const std::string reset = "localtime link invalid; resetting to America/Los_Angeles";
const std::string not_touched = "Cannot touch file /var/db/timezone/needs_cleanup";

/// A device whose next start gives up an update and switches to another, so that every link and
/// file is written.
class program : public device {
protected:
    void SetUp() override {
        renew();
        install_system("2016f");
        link_data(install_update("2016e.1.0"));
        make_link(paths::latest_link, install_update("2016g.1.0"));
        make_file(paths::version_record, std::string(100, 'x'));
    }

    static void check_done() {
        check_data_links("/var/db/timezone/tz/2016g.1.0");
        EXPECT_EQ(entry(paths::cleanup_marker), "[]");
        EXPECT_EQ(entry(paths::version_record), "[2016f.1.0_2016g.1.0]");
        EXPECT_EQ(entry(paths::localtime_link), "-> /var/db/timezone/zoneinfo/America/Los_Angeles");
    }
};

bool opens(const system_call& call) {
    return call.number == SYS_openat && !call.paths.empty();
}

/// Starts the program and returns the first calls that it makes, as paths below "/var/db/" with the
/// flags of those that it opens, as the protection class that it sets, and as "close".
strings first_calls(std::size_t count) {
    strings calls;
    trace_start([&](const system_call& call) {
        if (!call.paths.empty()) {
            const std::string flags = opens(call) ? " " + std::to_string(call.arguments[2]) : "";
            calls.push_back(call.paths[0].substr(8) + flags);
        } else if (call.number == SYS_fcntl && call.arguments[1] == 64) {
            calls.push_back("class " + std::to_string(call.arguments[2]));
        } else if (call.number == SYS_close && !calls.empty()) {
            calls.emplace_back("close");
        }
        return 0;
    });
    calls.resize(count);
    return calls;
}

} // namespace

TEST_F(program, creates_its_files_with_the_modes_that_the_mask_leaves) {
    remove_all(paths::version_record);
    check_start({given_up, reset}, 0, [] { ::umask(0); });
    check_done();
    for (const char* file : {paths::cleanup_marker, paths::version_record}) {
        struct stat status {};
        EXPECT_EQ(::stat(file, &status), 0);
        EXPECT_EQ(status.st_mode, S_IFREG | 0666U);
    }
}

TEST_F(program, does_its_work_whatever_becomes_of_its_standard_streams) {
    const std::function<void()> preparations[] = {
        [] { ::close_range(0, 2, 0); },
        [] { ::close(STDERR_FILENO); },
        [] { ::dup2(::open("/dev/full", O_WRONLY), STDERR_FILENO); },
        [] { // a pipe whose reader is gone
            int ends[2] = {};
            ::signal(SIGPIPE, SIG_DFL);
            EXPECT_EQ(::pipe(ends), 0);
            ::dup2(ends[1], STDERR_FILENO);
            ::close(ends[0]);
        },
    };
    for (const auto& prepare : preparations) {
        SetUp();
        check_start({}, 0, prepare);
        check_done();
    }
}

TEST_F(program, goes_on_when_no_file_may_grow) {
    check_start({}, 0, [] {
        const rlimit none = {0, 0};
        ::setrlimit(RLIMIT_FSIZE, &none);
    });
    EXPECT_EQ(entry(paths::version_record), "[]");
    EXPECT_EQ(entry(paths::localtime_link), "-> /var/db/timezone/zoneinfo/America/Los_Angeles");
}

TEST_F(program, deletes_what_earlier_starts_left) {
    link_data("");
    remove_all(paths::latest_link);
    make_link(paths::localtime_link, "/var/db/timezone/zoneinfo");
    make_file(paths::cleanup_marker, "left");
    make_file(paths::stale_icu);
    check_start();
    EXPECT_EQ(entry(paths::cleanup_marker), "nothing");
    EXPECT_EQ(entry(paths::stale_icu), "nothing");
    make_directory(paths::stale_icu);
    check_start();
    EXPECT_EQ(entry(paths::stale_icu), "nothing");
    make_file(std::string(paths::stale_icu) + "/entry");
    check_start();
    EXPECT_EQ(entry(paths::stale_icu), "directory");
}

TEST_F(program, creates_no_directory) {
    remove_all("/var/db");
    const std::string not_created = failed(
        "create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default", ENOENT);
    check_start(
        {failed("Bad zoneinfo link ", ENOENT),
            "Invalid current symlinks; resetting to system partition", not_created,
            failed("Unable to locate data; resetting to system partition", ENOENT), not_created},
        1);
    EXPECT_EQ(entry("/var/db"), "nothing");
}

TEST_F(program, prepares_the_directories_that_are_there_before_anything_else) {
    const std::string flags = " " + std::to_string(O_RDONLY | O_CLOEXEC);
    const strings first = {"timezone/" + flags, "class 4", "close", "timezone/tz/" + flags};
    const strings last = {"timezone/needs_cleanup", "icu"};
    EXPECT_EQ(first_calls(8), (first + strings{"class 4", "close"} + last));
    remove_all(paths::dataset_root);
    EXPECT_EQ(first_calls(6), first + last);
}

TEST_F(program, writes_each_warning_at_once_and_opens_only_its_own_files_for_writing) {
    strings written;
    trace_start([&](const system_call& call) {
        if (call.number == SYS_write && call.arguments[0] == STDERR_FILENO) {
            written.emplace_back("warning");
        } else if (opens(call) && (call.arguments[2] & O_ACCMODE) != O_RDONLY) {
            written.push_back(call.paths[0] + std::to_string(call.arguments[2]));
        }
        return 0;
    });
    EXPECT_EQ(written,
        (strings{"warning", paths::cleanup_marker + std::to_string(O_RDWR | O_CREAT),
            paths::version_record + std::to_string(O_WRONLY | O_CREAT | O_TRUNC), "warning"}));
}

TEST_F(program, reports_a_marker_that_cannot_be_examined_or_closed) {
    for (const int number : {SYS_newfstatat, SYS_close}) {
        SetUp();
        bool marker_is_open = false;
        trace_start(
            [&](const system_call& call) {
                const bool fail = marker_is_open && call.number == number;
                marker_is_open =
                    opens(call) ? call.paths[0] == paths::cleanup_marker : marker_is_open && !fail;
                return fail ? EIO : 0;
            },
            {given_up, failed(not_touched, EIO), reset});
    }
}

TEST_F(program, goes_on_when_no_file_can_be_opened) {
    const int status = trace_start([](const system_call& call) { return opens(call) ? EMFILE : 0; },
        refused(".1.0") + strings{failed(not_touched, EMFILE), reset});
    EXPECT_EQ(status, 0);
    check_data_links("/var/db/timezone/tz/2016g.1.0"); // the formats are unknown, and so the same
}
