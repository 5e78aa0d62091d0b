#include "paths.h"
#include "support/observe.h"
#include "support/program.h"

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace
{

class program : public device
{
protected:
    /// A device that is given up and switched in one start, so that every kind of file is written.
    void SetUp() override
    {
        device::SetUp();
        install_system("2016f", "44l");
        install_update("2016e.1.0", "44l");
        newest = install_update("2016g.1.0", "44l");
        make_link(paths::zoneinfo_link, "/var/db/timezone/tz/2016e.1.0/zoneinfo");
        make_link(paths::icu_link, "/var/db/timezone/tz/2016e.1.0/icutz");
        make_link(paths::latest_link, newest);
    }

    void check_switched() const
    {
        check_current(newest);
        check_file(paths::cleanup_marker, "");
        check_file(paths::version_record, "2016f.1.0_2016g.1.0");
        check_link(paths::localtime_link, "/var/db/timezone/zoneinfo/America/Los_Angeles");
    }

    const strings warnings = {
        "Symlink points at data incompatible with installed system",
        "localtime link invalid; resetting to America/Los_Angeles",
    };
    std::string newest;
};

mode_t mode_of(const char* path)
{
    struct stat status {
    };
    return ::stat(path, &status) == 0 ? status.st_mode & 07777U : 0;
}

} // namespace

TEST_F(program, creates_the_marker_and_the_record_for_everyone_to_read_and_write)
{
    check_start(warnings, 0, [] { ::umask(0); });
    check_switched();
    EXPECT_EQ(mode_of(paths::cleanup_marker), 0666U);
    EXPECT_EQ(mode_of(paths::version_record), 0666U);
}

TEST_F(program, does_its_work_with_standard_streams_closed)
{
    check_start({}, 0, [] { ::close_range(0, 2, 0); });
    check_switched();
}

TEST_F(program, deletes_what_earlier_starts_left)
{
    namespace fs = std::filesystem;
    make_file("/var/elsewhere");
    for (const auto& make_stale : std::initializer_list<void (*)()>{
             [] { make_file(paths::stale_icu); },
             [] { make_directory(paths::stale_icu); },
             [] { make_link(paths::stale_icu, "/var/elsewhere"); },
         }) {
        make_stale();
        make_link(paths::localtime_link, "/var/db/timezone/zoneinfo");
        make_link(paths::zoneinfo_link, paths::system_zoneinfo);
        fs::remove(paths::latest_link);
        make_file(paths::cleanup_marker, "left");
        check_start();
        check_nothing_at(paths::cleanup_marker);
        check_nothing_at(paths::stale_icu);
    }
    check_file("/var/elsewhere", "");
    make_file(std::string(paths::stale_icu) + "/entry");
    check_start();
    check_file(std::string(paths::stale_icu) + "/entry", "");
}

TEST_F(program, reports_a_device_without_directories_and_ends_with_1)
{
    std::filesystem::remove_all("/var/db");
    const strings not_created = {failed(
        "create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default", ENOENT
    )};
    check_start(
        {"Bad zoneinfo link ", "Invalid current symlinks; resetting to system partition",
         not_created[0], failed("Unable to locate data; resetting to system partition", ENOENT),
         not_created[0]},
        1
    );
}

TEST_F(program, sets_the_protection_class_of_its_directories_before_anything_else)
{
    strings trace;
    trace_start([&](const system_call& call) {
        if (!call.paths.empty()) {
            trace.push_back(call.paths.substr(1));
        } else if (call.number == SYS_fcntl && call.arguments[1] == 64) {
            trace.push_back("class " + std::to_string(call.arguments[2]));
        }
        return 0;
    });
    trace.resize(6);
    EXPECT_EQ(
        trace, (strings{
                   "/var/db/timezone/", "class 4", "/var/db/timezone/tz/", "class 4",
                   "/var/db/timezone/needs_cleanup", "/var/db/icu"})
    );
}

TEST_F(program, judges_a_version_without_a_length_limit)
{
    const std::string text = "2016" + std::string(1'000'000, 'f');
    const std::string zeros = std::string(1'000'000, '0') + "2016f";
    make_link(paths::localtime_link, "/var/db/timezone/zoneinfo");
    for (const std::string& version : {text, zeros}) {
        make_link(paths::zoneinfo_link, paths::system_zoneinfo);
        make_link(paths::latest_link, install_update("2017a.1.0", "44l"));
        install_system(version, "44l");
        check_start();
        check_file(paths::version_record, version + ".1.0_2017a.1.0");
    }
}
