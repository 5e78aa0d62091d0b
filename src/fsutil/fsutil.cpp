#include "fsutil/fsutil.h"

#include <cerrno>

#include <err.h>
#include <unistd.h>

void fsutil::remove(const std::string& path) {
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
        const int error = errno;
        warn("remove: could not remove %s", path.c_str());
        throw error;
    }
}

bool fsutil::exists(const std::string& path) noexcept {
    return ::access(path.c_str(), F_OK) == 0;
}

std::string fsutil::read_symlink(const std::string& path) {
    char text[1025];
    const ssize_t length = ::readlink(path.c_str(), text, sizeof text - 1);
    if (length >= 0) {
        text[length] = '\0';
        return text;
    }
    if (errno == ENOENT) {
        return {};
    }
    const int error = errno;
    warn("read_symlink: %s", path.c_str());
    throw error;
}

void fsutil::create_symlink(const std::string& target, const std::string& link_path) {
    if (::symlink(target.c_str(), link_path.c_str()) != 0) {
        const int error = errno;
        warn("create_symlink: from %s to %s", link_path.c_str(), target.c_str());
        throw error;
    }
}
