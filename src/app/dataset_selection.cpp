#include "app/dataset_selection.h"

#include "data_protection.h"
#include "dataset/dataset_links.h"
#include "dataset/mira_dataset.h"
#include "paths.h"

#include <fstream>
#include <string>

#include <err.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

std::string read_current_link_or_reset() {
    try {
        return read_current_link();
    } catch (...) {
        warn("Invalid current symlinks; resetting to system partition");
        reset_to_system_partition();
        return {};
    }
}

/// Creates the clean-up marker, an empty file, or opens the one that exists. Warns "Cannot touch
/// file %s" when opening, examining or closing it fails, even if the marker exists then.
void touch_cleanup_marker() noexcept {
    const int marker = open_dprotected_np(
        paths::cleanup_marker, O_RDWR | O_CREAT, timezone_protection_class, 0, 0666);
    bool touched = false;
    if (marker != -1) {
        // Only whether fstat succeeds counts; the status itself is not used.
        struct stat status;
        touched = ::fstat(marker, &status) == 0;
        touched = ::close(marker) == 0 && touched;
    }
    if (!touched) {
        warn("Cannot touch file %s", paths::cleanup_marker);
    }
}

/// Writes the version record: the version text of `active`, an underscore and the version text of
/// `latest`, without a line end. Replaces an earlier record. Failures are ignored and not reported,
/// since the links are already switched.
void write_version_diff_record(const mira_dataset& active, const mira_dataset& latest) noexcept {
    try {
        std::ofstream record(paths::version_record);
        record << active.version_string() << '_' << latest.version_string();
    } catch (...) {
        // Out of memory: ignored like a failed open or write.
    }
}

} // namespace

void select_dataset() {
    const mira_dataset system;
    const std::string latest_path = read_latest_link();
    const mira_dataset current(read_current_link_or_reset());

    // The dataset in use before a switch to the latest one.
    const mira_dataset* active = &current;
    if (!current.compatible_schema(system) || system.newer_than(current)) {
        warn("Symlink points at data incompatible with installed system");
        reset_to_system_partition();
        touch_cleanup_marker();
        active = &system;
    }
    if (latest_path.empty()) {
        return;
    }
    const mira_dataset latest(latest_path);
    // A rule of the system: a reset does not change what the latest dataset is compared with.
    if (!latest.compatible_schema(system) || !latest.newer_than(current)) {
        warn("New update not compatible or older version");
        return;
    }
    latest.make_current();
    if (*active != system) {
        touch_cleanup_marker();
    }
    write_version_diff_record(*active, latest);
}

void reset_to_system_partition() {
    const mira_dataset system;
    system.make_current();
}
