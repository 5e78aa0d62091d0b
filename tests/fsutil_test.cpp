#include "fsutil/fsutil.h"
#include "support/run.h"

#include <algorithm>
#include <cerrno>
#include <string>

#include <unistd.h>

namespace
{

using links = device;

void check_failure(int error, const std::string& warning, const std::function<void()>& action)
{
    check_action(action, {failed(warning, error)}, error);
}

} // namespace

TEST_F(links, are_removed_and_not_what_they_point_at)
{
    make_file("/var/file");
    make_link("/var/link", "/var/file");
    make_link("/var/dangling", "/var/missing");
    for (const char* path : {"/var/link", "/var/dangling", "/var/missing"}) {
        check_action([&] { fsutil::remove(path); });
        check_nothing_at(path);
    }
    check_file("/var/file", "");
}

TEST_F(links, exist_when_they_lead_somewhere)
{
    make_file("/var/file", "", 0);
    make_link("/var/link", "/var/file");
    make_link("/var/dangling", "/var/missing");
    check_action([] {
        EXPECT_TRUE(fsutil::exists("/var/db") && fsutil::exists("/var/link"));
        EXPECT_FALSE(fsutil::exists("/var/dangling") || fsutil::exists("/var/file/x"));
    });
}

TEST_F(links, are_read_up_to_1024_bytes)
{
    for (const std::size_t length : {1U, 1023U, 1024U, 1025U, 1030U}) {
        make_link("/var/link", std::string(length, 'x'));
        const std::string text(std::min<std::size_t>(length, 1024), 'x');
        check_action([&] { EXPECT_EQ(fsutil::read_symlink("/var/link"), text); });
    }
    check_action([] { EXPECT_EQ(fsutil::read_symlink("/var/missing"), ""); });
}

TEST_F(links, fail_with_the_errno_of_the_call)
{
    make_file("/var/file");
    make_link("/var/link", "old");
    const std::string remove = "remove: could not remove ";
    check_failure(EISDIR, remove + "/var/db", [] { fsutil::remove("/var/db"); });
    check_failure(ENOTDIR, remove + "/var/file/x", [] { fsutil::remove("/var/file/x"); });

    const std::string read = "read_symlink: ";
    check_failure(EINVAL, read + "/var/file", [] { fsutil::read_symlink("/var/file"); });
    check_failure(ENOTDIR, read + "/var/file/x", [] { fsutil::read_symlink("/var/file/x"); });

    const std::string create = "create_symlink: from ";
    check_failure(
        EEXIST, create + "/var/link to new", [] { fsutil::create_symlink("new", "/var/link"); });
    check_failure(ENOENT, create + "/var/missing/link to new",
        [] { fsutil::create_symlink("new", "/var/missing/link"); });
    check_link("/var/link", "old");
}

TEST_F(links, fail_with_the_errno_of_the_call_when_the_warning_cannot_be_written)
{
    for (const auto& [error, action] : std::initializer_list<std::pair<int, void (*)()>>{
             {EISDIR, [] { fsutil::remove("/var/db"); }},
             {EINVAL, [] { fsutil::read_symlink("/var/db"); }},
             {EEXIST, [] { fsutil::create_symlink("new", "/var/db"); }}}) {
        check_action(
            [action = action] {
                ::close(STDERR_FILENO);
                action();
            },
            {}, error);
    }
}
