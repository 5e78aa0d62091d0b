#include "fsutil/fsutil.h"
#include "support/observe.h"

#include <algorithm>
#include <cerrno>
#include <string>

#include <unistd.h>

namespace
{

using fsutil_on = device;

const std::string base = "/var/db/";
const std::string missing = base + "missing";

} // namespace

TEST_F(fsutil_on, remove_takes_the_entry_and_never_what_it_points_at)
{
    make_file(base + "file");
    make_link(base + "link", base + "file");
    make_link(base + "dangling", missing);
    check_action([] {
        fsutil::remove(base + "link");
        fsutil::remove(base + "dangling");
        fsutil::remove(missing);
    });
    check_nothing_at(base + "link");
    check_nothing_at(base + "dangling");
    check_file(base + "file", "");
}

TEST_F(fsutil_on, remove_throws_eisdir_and_enotdir)
{
    make_file(base + "file");
    const std::string message = "remove: could not remove ";
    check_action(
        [] { fsutil::remove("/var/db"); }, {failed(message + "/var/db", EISDIR)},
        "int " + std::to_string(EISDIR)
    );
    check_action(
        [] { fsutil::remove(base + "file/x"); }, {failed(message + base + "file/x", ENOTDIR)},
        "int " + std::to_string(ENOTDIR)
    );
}

TEST_F(fsutil_on, exists_follows_links)
{
    make_file(base + "file", "", 0);
    make_link(base + "link", base + "file");
    make_link(base + "dangling", missing);
    check_action([] {
        EXPECT_TRUE(fsutil::exists(base));
        EXPECT_TRUE(fsutil::exists(base + "file"));
        EXPECT_TRUE(fsutil::exists(base + "link"));
        EXPECT_FALSE(fsutil::exists(base + "dangling"));
        EXPECT_FALSE(fsutil::exists(missing));
        EXPECT_FALSE(fsutil::exists(base + "file/x"));
    });
}

TEST_F(fsutil_on, read_symlink_cuts_the_text_at_1024_bytes)
{
    const std::string link = base + "link";
    for (const std::size_t length : {1U, 1023U, 1024U, 1025U, 1030U}) {
        make_link(link, std::string(length, 'x'));
        const std::string expected(std::min<std::size_t>(length, 1024), 'x');
        check_action([&] { EXPECT_EQ(fsutil::read_symlink(link), expected); });
    }
    check_action([] { EXPECT_EQ(fsutil::read_symlink(missing), ""); });
}

TEST_F(fsutil_on, read_symlink_throws_einval_and_enotdir)
{
    make_file(base + "file");
    check_action(
        [] { fsutil::read_symlink(base + "file"); },
        {failed("read_symlink: " + base + "file", EINVAL)}, "int " + std::to_string(EINVAL)
    );
    check_action(
        [] { fsutil::read_symlink(base + "file/x"); },
        {failed("read_symlink: " + base + "file/x", ENOTDIR)}, "int " + std::to_string(ENOTDIR)
    );
}

TEST_F(fsutil_on, create_symlink_does_not_look_at_the_target)
{
    check_action([] { fsutil::create_symlink("no such target", base + "link"); });
    check_link(base + "link", "no such target");
}

TEST_F(fsutil_on, create_symlink_throws_eexist_and_enoent)
{
    make_link(base + "link", "old");
    const std::string message = "create_symlink: from ";
    check_action(
        [] { fsutil::create_symlink("new", base + "link"); },
        {failed(message + base + "link to new", EEXIST)}, "int " + std::to_string(EEXIST)
    );
    check_link(base + "link", "old");
    check_action(
        [] { fsutil::create_symlink("new", missing + "/link"); },
        {failed(message + missing + "/link to new", ENOENT)}, "int " + std::to_string(ENOENT)
    );
}

TEST_F(fsutil_on, what_is_thrown_is_the_errno_of_the_call_when_the_warning_cannot_be_written)
{
    check_action([] {
        const int standard_error = ::dup(STDERR_FILENO);
        ::close(STDERR_FILENO);
        try {
            fsutil::remove("/var/db");
        } catch (int error) {
            EXPECT_EQ(error, EISDIR);
        }
        ::dup2(standard_error, STDERR_FILENO);
        ::close(standard_error);
    });
}
