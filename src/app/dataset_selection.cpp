#include "app/dataset_selection.h"

#include "data_protection.h"
#include "dataset/dataset_links.h"
#include "dataset/mira_dataset.h"
#include "paths.h"

#include <fstream>
#include <string>

#include <err.h>
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

/// Creates the clean-up marker, an empty file that says that an updated dataset was given up. A
/// marker that exists is left unchanged. A failure warns "Cannot touch file %s".
void touch_cleanup_marker() noexcept {
    const int marker = open_dprotected_np(
        paths::cleanup_marker, O_RDWR | O_CREAT, timezone_protection_class, 0, 0666);
    bool touched = false;
    if (marker != -1) {
        // Only whether the marker can be examined is of interest, not what that shows.
        struct stat status;
        touched = ::fstat(marker, &status) == 0;
        touched = ::close(marker) == 0 && touched;
    }
    if (!touched) {
        warn("Cannot touch file %s", paths::cleanup_marker);
    }
}

/// Writes the version record, whole and without a line end: the version text of `active`, the
/// dataset in use before the switch, an underscore, and that of `latest`. Reports no failure: the
/// record is news for others, and the switch is done.
void write_version_diff_record(const mira_dataset& active, const mira_dataset& latest) noexcept {
    try {
        std::ofstream record(paths::version_record);
        record << active.version_string() << '_' << latest.version_string();
    } catch (...) {
        // Out of memory for the texts or the stream: ignored like every other failure here.
    }
}

} // namespace

void select_dataset() {
    const mira_dataset system;
    const std::string latest_path = read_latest_link();
    const mira_dataset current(read_current_link_or_reset());

    // What was in use before a switch to the latest dataset.
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
    // Compared with the dataset that was current at the start, even when that has just been given
    // up: an update that is newer than it is taken, though the system's may be newer still.
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
