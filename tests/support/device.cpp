#include "support/device.h"

#include "paths.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace fs = std::filesystem;

namespace {

/// Enters a private mount namespace, as root of a user namespace where the caller is not root.
/// Returns 0 or the errno of the refusal.
int enter_namespace() {
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
    return ::mount("none", "/", "none", MS_REC | MS_PRIVATE, nullptr) == 0 ? 0 : errno;
}

} // namespace

void device::renew() {
    static const int refusal = enter_namespace();
    if (refusal != 0) {
        // Not an assertion, which a test could survive: what it does next would be done to the
        // machine's own /usr/share and /var.
        std::fprintf(stderr, "a private mount namespace is refused: %s\n", std::strerror(refusal));
        std::_Exit(EXIT_FAILURE);
    }
    for (const char* root : {"/usr/share", "/var"}) {
        static std::set<std::string> mounted;
        if (!mounted.insert(root).second) {
            ::umount2(root, MNT_DETACH);
        }
        if (::mount("tmpfs", root, "tmpfs", 0, "mode=0755") != 0) {
            std::fprintf(stderr, "no device at %s: %s\n", root, std::strerror(errno));
            std::_Exit(EXIT_FAILURE);
        }
    }
    ::umask(022);
    make_directory(paths::dataset_root);
}

void make_file(const std::string& path, const std::string& content, mode_t mode) {
    remove_all(path);
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
    fs::permissions(path, fs::perms(mode));
}

void make_directory(const std::string& path) {
    remove_all(path);
    fs::create_directories(path);
}

void make_link(const std::string& path, const std::string& text) {
    remove_all(path);
    fs::create_directories(fs::path(path).parent_path());
    fs::create_symlink(text, path);
}

void remove_all(const std::string& path) {
    fs::remove_all(path);
}

void install_system(const std::string& version, const std::string& format) {
    make_file("/usr/share/zoneinfo.default/+VERSION", version + "\n");
    make_file("/usr/share/zoneinfo.default/Asia/Tokyo");
    make_file("/usr/share/icu/icutzformat.txt", format + "\n");
}

std::string install_update(const std::string& version, const std::string& format) {
    std::string directory = "/var/db/timezone/tz/" + version;
    make_directory(directory + "/zoneinfo");
    if (!format.empty()) {
        make_file(directory + "/icutz/icutz" + format + ".dat");
    }
    return directory;
}

void link_data(const std::string& dataset) {
    remove_all(paths::icu_link);
    if (dataset.empty()) {
        make_link(paths::zoneinfo_link, "/usr/share/zoneinfo.default");
    } else {
        make_link(paths::zoneinfo_link, dataset + "/zoneinfo");
        make_link(paths::icu_link, dataset + "/icutz");
    }
}

std::string entry(const std::string& path) {
    const fs::file_status status = fs::symlink_status(path);
    if (fs::is_symlink(status)) {
        return "-> " + fs::read_symlink(path).string();
    }
    if (fs::is_regular_file(status)) {
        std::ifstream file(path, std::ios::binary);
        return "[" + std::string(std::istreambuf_iterator<char>(file), {}) + "]";
    }
    return fs::exists(status) ? "directory" : "nothing";
}

void check_data_links(const std::string& dataset) {
    const bool system = dataset.empty();
    EXPECT_EQ(entry(paths::zoneinfo_link),
        system ? "-> /usr/share/zoneinfo.default" : "-> " + dataset + "/zoneinfo");
    EXPECT_EQ(entry(paths::icu_link), system ? "nothing" : "-> " + dataset + "/icutz");
}
