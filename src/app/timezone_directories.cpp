#include "app/timezone_directories.h"

#include "data_protection.h"
#include "paths.h"

#include <fcntl.h>
#include <unistd.h>

namespace {

void set_directory_protection_class(const char* path) noexcept {
    const int directory = ::open(path, O_RDONLY | O_CLOEXEC);
    if (directory == -1) {
        return;
    }
    // Results are ignored: the links matter more than the protection class.
    ::fcntl(directory, F_SETPROTECTIONCLASS, timezone_protection_class);
    ::close(directory);
}

} // namespace

void prepare_timezone_directories() noexcept {
    set_directory_protection_class(paths::timezone_directory);
    set_directory_protection_class(paths::dataset_root);
}
