#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <csignal>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace
{

/// A device whose next start gives up an update and switches to another, so that every link and
/// file is written.
class program : public device
{
protected:
    void SetUp() override
    {
        device::SetUp();
        install_system("2016f");
        link_data(install_update("2016e.1.0"));
        make_link(paths::latest_link, install_update("2016g.1.0"));
        make_file(paths::version_record, std::string(100, 'x'), 0600);
    }

    static void check_done()
    {
        check_data_links("/var/db/timezone/tz/2016g.1.0");
        check_file(paths::cleanup_marker, "");
        check_file(paths::version_record, "2016f.1.0_2016g.1.0");
        check_link(paths::localtime_link, "/var/db/timezone/zoneinfo/America/Los_Angeles");
    }

    const strings warnings = {"Symlink points at data incompatible with installed system",
        "localtime link invalid; resetting to America/Los_Angeles"};
};

mode_t mode_of(const char* path)
{
    struct stat status {
    };
    return ::stat(path, &status) == 0 ? status.st_mode & 07777U : 0;
}

} // namespace

TEST_F(program, creates_its_files_with_the_modes_that_the_mask_leaves)
{
    remove_all(paths::version_record);
    check_start(warnings, 0, [] { ::umask(0); });
    check_done();
    EXPECT_EQ(mode_of(paths::cleanup_marker), 0666U);
    EXPECT_EQ(mode_of(paths::version_record), 0666U);
}

TEST_F(program, does_its_work_whatever_becomes_of_its_standard_streams)
{
    const std::function<void()> preparations[] = {
        [] { ::close_range(0, 2, 0); },
        [] { ::close(STDERR_FILENO); },
        [] { ::dup2(::open("/dev/full", O_WRONLY), STDERR_FILENO); },
        [] { // a pipe whose reader is gone
            int ends[2];
            ::signal(SIGPIPE, SIG_DFL);
            if (::pipe(ends) == 0 && ::dup2(ends[1], STDERR_FILENO) != -1) {
                ::close(ends[0]);
            }
        },
    };
    for (const auto& prepare : preparations) {
        TearDown();
        SetUp();
        check_start({}, 0, prepare);
        check_done();
    }
}

TEST_F(program, deletes_what_earlier_starts_left)
{
    const std::string entry = std::string(paths::stale_icu) + "/entry";
    link_data("");
    remove_all(paths::latest_link);
    make_link(paths::localtime_link, "/var/db/timezone/zoneinfo");
    make_file(paths::cleanup_marker, "left");
    make_file(paths::stale_icu);
    check_start();
    check_nothing_at(paths::cleanup_marker);
    check_nothing_at(paths::stale_icu);
    make_directory(paths::stale_icu);
    check_start();
    check_nothing_at(paths::stale_icu);
    make_file(entry);
    check_start();
    check_file(entry, "");
}

TEST_F(program, creates_no_directory)
{
    remove_all("/var/db");
    const std::string not_created = failed(
        "create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default", ENOENT);
    check_start(
        {failed("Bad zoneinfo link ", ENOENT),
            "Invalid current symlinks; resetting to system partition", not_created,
            failed("Unable to locate data; resetting to system partition", ENOENT), not_created},
        1);
    check_nothing_at("/var/db");
}

TEST_F(program, prepares_the_directories_that_are_there_before_anything_else)
{
    const auto first_calls = [](std::size_t count) {
        strings calls;
        trace_start([&](const system_call& call) {
            if (call.number == SYS_openat && !call.paths.empty()) {
                calls.push_back(call.paths[0] + " " + std::to_string(call.arguments[2]));
            } else if (!call.paths.empty()) {
                calls.push_back(call.paths[0]);
            } else if (call.number == SYS_fcntl && call.arguments[1] == 64) {
                calls.push_back("class " + std::to_string(call.arguments[2]));
            } else if (call.number == SYS_close && !calls.empty()) {
                calls.emplace_back("close");
            }
            return 0;
        });
        calls.resize(count);
        return calls;
    };
    const std::string read_only = " " + std::to_string(O_RDONLY | O_CLOEXEC);
    const strings first = {paths::timezone_directory + read_only, "class 4", "close"};
    const strings opened = {paths::dataset_root + read_only};
    const strings last = {paths::cleanup_marker, paths::stale_icu};
    EXPECT_EQ(first_calls(8), first + opened + strings{"class 4", "close"} + last);
    remove_all(paths::dataset_root);
    EXPECT_EQ(first_calls(6), first + opened + last);
}

TEST_F(program, writes_each_warning_at_once)
{
    int writes = 0;
    trace_start([&](const system_call& call) {
        writes += call.number == SYS_write && call.arguments[0] == STDERR_FILENO ? 1 : 0;
        return 0;
    });
    EXPECT_EQ(writes, 2);
}

TEST_F(program, opens_nothing_for_writing_but_the_marker_and_the_record)
{
    strings opened;
    trace_start([&](const system_call& call) {
        if (call.number == SYS_openat && !call.paths.empty() &&
            (call.arguments[2] & O_ACCMODE) != O_RDONLY) {
            opened.push_back(call.paths[0] + " " + std::to_string(call.arguments[2]));
        }
        return 0;
    });
    const int record_flags = O_WRONLY | O_CREAT | O_TRUNC;
    EXPECT_EQ(opened,
        (strings{std::string(paths::cleanup_marker) + " " + std::to_string(O_RDWR | O_CREAT),
            std::string(paths::version_record) + " " + std::to_string(record_flags)}));
    check_done();
}

TEST_F(program, reports_a_marker_that_cannot_be_examined_or_closed)
{
    for (const unsigned long number : {SYS_newfstatat, SYS_close}) {
        bool marker_is_open = false;
        trace_start(
            [&](const system_call& call) {
                const bool fail = marker_is_open && call.number == number;
                marker_is_open =
                    !fail && (marker_is_open || (call.number == SYS_openat && !call.paths.empty() &&
                                                    call.paths[0] == paths::cleanup_marker));
                return fail ? EIO : 0;
            },
            {warnings[0], failed("Cannot touch file /var/db/timezone/needs_cleanup", EIO),
                warnings[1]});
        TearDown();
        SetUp();
    }
}

TEST_F(program, ends_with_0_when_no_file_can_be_opened)
{
    const int status = trace_start(
        [](const system_call& call) {
            return call.number == SYS_openat && !call.paths.empty() ? EMFILE : 0;
        },
        refused(".1.0") +
            strings{
                failed("Cannot touch file /var/db/timezone/needs_cleanup", EMFILE), warnings[1]});
    EXPECT_EQ(status, 0);
    check_data_links("/var/db/timezone/tz/2016g.1.0"); // the formats are unknown, and so the same
}
