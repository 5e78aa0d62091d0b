#include "support/device.h"

#include "paths.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace fs = std::filesystem;

namespace
{

constexpr const char* device_roots[] = {"/usr/share", "/var"};

void write_proc_file(const char* path, const std::string& text)
{
    std::ofstream(path) << text;
}

/// Enters a mount namespace of this process's own, as the root of a user namespace where the caller
/// is not root already. Returns an errno, or 0.
int enter_private_namespace()
{
    const uid_t user = ::geteuid();
    const gid_t group = ::getegid();
    if (::unshare(user == 0 ? CLONE_NEWNS : CLONE_NEWNS | CLONE_NEWUSER) != 0) {
        return errno;
    }
    if (user != 0) {
        write_proc_file("/proc/self/setgroups", "deny");
        write_proc_file("/proc/self/uid_map", "0 " + std::to_string(user) + " 1");
        write_proc_file("/proc/self/gid_map", "0 " + std::to_string(group) + " 1");
    }
    return ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 ? 0 : errno;
}

} // namespace

void device::SetUp()
{
    static const int refused = enter_private_namespace();
    if (refused != 0) {
        const std::string reason =
            std::string("the kernel refuses a private mount namespace: ") + std::strerror(refused);
        if (std::getenv("CI") != nullptr) {
            FAIL() << reason;
        }
        GTEST_SKIP() << reason;
    }
    for (const char* root : device_roots) {
        ASSERT_EQ(::mount("tmpfs", root, "tmpfs", 0, "mode=0755"), 0) << std::strerror(errno);
    }
    ::umask(022);
    make_directory(paths::dataset_root);
}

void device::TearDown()
{
    for (const char* root : device_roots) {
        ::umount2(root, MNT_DETACH);
    }
}

void make_file(const std::string& path, const std::string& content, mode_t mode)
{
    make_directory(fs::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
    ASSERT_EQ(::chmod(path.c_str(), mode), 0) << path;
}

void make_directory(const std::string& path)
{
    fs::create_directories(path);
}

void make_link(const std::string& path, const std::string& text)
{
    fs::remove(path);
    fs::create_symlink(text, path);
}

void install_system(const std::string& version, const std::string& format)
{
    const std::string tree = paths::system_zoneinfo;
    make_file(tree + "/+VERSION", version + "\n");
    make_file(tree + "/America/Los_Angeles");
    make_file(tree + "/Asia/Tokyo");
    make_file(std::string(paths::system_icu) + "/icutzformat.txt", format + "\n");
}

std::string install_update(const std::string& version, const std::string& format)
{
    std::string directory = paths::dataset_root + version;
    make_file(directory + "/zoneinfo/America/Los_Angeles");
    if (!format.empty()) {
        make_file(directory + "/icutz/icutz" + format + ".dat");
    }
    return directory;
}

void make_read_only(const std::string& root)
{
    ASSERT_EQ(::mount(nullptr, root.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
}

void check_link(const std::string& path, const std::string& text)
{
    ASSERT_TRUE(fs::is_symlink(path)) << path;
    EXPECT_EQ(fs::read_symlink(path).string(), text);
}

void check_file(const std::string& path, const std::string& content)
{
    ASSERT_TRUE(fs::is_regular_file(fs::symlink_status(path))) << path;
    std::ifstream file(path, std::ios::binary);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), content);
}

void check_nothing_at(const std::string& path)
{
    EXPECT_FALSE(fs::exists(fs::symlink_status(path))) << path;
}

void check_current(const std::string& dataset)
{
    if (dataset.empty()) {
        check_link(paths::zoneinfo_link, paths::system_zoneinfo);
        check_nothing_at(paths::icu_link);
    } else {
        check_link(paths::zoneinfo_link, dataset + "/zoneinfo");
        check_link(paths::icu_link, dataset + "/icutz");
    }
}
