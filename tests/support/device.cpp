#include "support/device.h"

#include "paths.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace fs = std::filesystem;

namespace
{

constexpr const char* device_roots[] = {"/usr/share", "/var"};

/// Enters a private mount namespace, as root of a user namespace where the caller is not root.
/// Returns 0 or the errno of the refusal.
int enter_namespace()
{
    const std::string user = std::to_string(::geteuid());
    const std::string group = std::to_string(::getegid());
    if (::unshare(user == "0" ? CLONE_NEWNS : CLONE_NEWNS | CLONE_NEWUSER) != 0) {
        return errno;
    }
    if (user != "0") {
        std::ofstream("/proc/self/setgroups") << "deny";
        std::ofstream("/proc/self/uid_map") << "0 " + user + " 1";
        std::ofstream("/proc/self/gid_map") << "0 " + group + " 1";
    }
    return ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 ? 0 : errno;
}

} // namespace

void device::SetUp()
{
    static const int refusal = enter_namespace();
    if (refusal != 0 && std::getenv("CI") == nullptr) {
        GTEST_SKIP() << "the kernel refuses a mount namespace: " << std::strerror(refusal);
    }
    ASSERT_EQ(refusal, 0) << std::strerror(refusal);
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
    remove_all(path);
    make_directory(fs::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
    fs::permissions(path, fs::perms(mode));
}

void make_directory(const std::string& path)
{
    fs::create_directories(path);
}

void make_link(const std::string& path, const std::string& text)
{
    remove_all(path);
    fs::create_symlink(text, path);
}

void remove_all(const std::string& path)
{
    fs::remove_all(path);
}

void install_system(const std::string& version, const std::string& format)
{
    make_file("/usr/share/zoneinfo.default/+VERSION", version + "\n");
    make_file("/usr/share/zoneinfo.default/Asia/Tokyo");
    make_file("/usr/share/icu/icutzformat.txt", format + "\n");
}

std::string install_update(const std::string& version, const std::string& format)
{
    std::string directory = "/var/db/timezone/tz/" + version;
    make_directory(directory + "/zoneinfo");
    if (!format.empty()) {
        make_file(directory + "/icutz/icutz" + format + ".dat");
    }
    return directory;
}

void link_data(const std::string& dataset)
{
    remove_all(paths::icu_link);
    if (dataset.empty()) {
        make_link(paths::zoneinfo_link, "/usr/share/zoneinfo.default");
    } else {
        make_link(paths::zoneinfo_link, dataset + "/zoneinfo");
        make_link(paths::icu_link, dataset + "/icutz");
    }
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

void check_data_links(const std::string& dataset)
{
    if (dataset.empty()) {
        check_link(paths::zoneinfo_link, "/usr/share/zoneinfo.default");
        check_nothing_at(paths::icu_link);
    } else {
        check_link(paths::zoneinfo_link, dataset + "/zoneinfo");
        check_link(paths::icu_link, dataset + "/icutz");
    }
}
