#include "app/dataset_selection.h"
#include "app/localtime_link.h"
#include "app/process.h"
#include "app/timezone_directories.h"
#include "paths.h"

#include <cstdio>

#include <err.h>

int main() try {
    prepare_process();
    prepare_timezone_directories();
    // Left over from earlier starts or systems. std::remove also deletes an empty directory, and
    // reports nothing.
    std::remove(paths::cleanup_marker);
    std::remove(paths::stale_icu);
    try {
        select_dataset();
    } catch (...) {
        warn("Unable to locate data; resetting to system partition");
        reset_to_system_partition();
    }
    repair_localtime_link();
    return 0;
} catch (...) {
    // There is no further fallback.
    return 1;
}
