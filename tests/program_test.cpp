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

TEST_F(program, makes_its_calls_in_order_and_each_warning_in_one_write)
{
    strings calls;
    strings opened;
    int writes = 0;
    trace_start([&](const system_call& call) {
        writes += call.number == SYS_write && call.arguments[0] == STDERR_FILENO ? 1 : 0;
        if (call.number == SYS_fcntl && call.arguments[1] == 64) {
            calls.push_back("class " + std::to_string(call.arguments[2]));
        }
        for (const std::string& path : call.paths) {
            if (!path.starts_with("/usr/share/")) {
                calls.push_back(path);
            }
            if (call.number == SYS_openat && (call.arguments[2] & O_ACCMODE) != O_RDONLY) {
                opened.push_back(path);
            }
        }
        return 0;
    });
    EXPECT_EQ(writes, 2);
    EXPECT_EQ(opened, (strings{paths::cleanup_marker, paths::version_record}));
    calls.resize(6);
    EXPECT_EQ(calls, (strings{paths::timezone_directory, "class 4", paths::dataset_root, "class 4",
                         paths::cleanup_marker, paths::stale_icu}));
    check_done();
}
