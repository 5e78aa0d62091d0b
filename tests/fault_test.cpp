#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <filesystem>
#include <map>
#include <set>
#include <string>

#include <sys/wait.h>

namespace fs = std::filesystem;

namespace {

/// A device with the system dataset 2016f, whose current dataset is an update or, where it is
/// empty, the system's, and whose latest dataset is 2016g or none.
struct state {
    std::string current;
    bool latest;
};
const state states[] = {
    {"", true}, {"2016f.1.1", true}, {"2016e.1.0", true}, {"2016e.1.0", false}, {"", false}};

/// Starts the program and calls `verdict` on the call of the given number, counted from the first
/// that names a file of the device; only those are made to fail. Returns the name of the file last
/// named by then, or an empty text when the program made fewer calls.
std::string disturb(int number, int verdict) {
    std::string name;
    std::string disturbed;
    const int status = trace_start([&](const system_call& call) {
        name = call.paths.empty() ? name : call.paths.back();
        if (name.empty() || (call.paths.empty() && verdict != kill_before) || number-- != 0) {
            return 0;
        }
        disturbed = name;
        return verdict;
    });
    EXPECT_EQ(WIFEXITED(status), verdict != kill_before || disturbed.empty());
    return disturbed;
}

using entries = std::map<std::string, std::string>;

/// Starts the program undisturbed, checks where the links lead, and returns what is at each path.
entries start() {
    EXPECT_EQ(trace_start([](const system_call&) { return 0; }), 0);
    entries left;
    for (const std::string path : {paths::zoneinfo_link, paths::icu_link, paths::localtime_link,
             paths::cleanup_marker, paths::version_record}) {
        left[path] = entry(path);
    }
    EXPECT_TRUE(fs::is_directory(paths::zoneinfo_link)); // through the link
    EXPECT_NE(left[paths::zoneinfo_link], "-> /var/db/timezone/tz/2016e.1.0/zoneinfo");
    EXPECT_TRUE(left[paths::localtime_link].starts_with("-> /var/db/timezone/zoneinfo/"));
    return left;
}

class faults : public device {
protected:
    void make_device(const state& before) {
        renew();
        install_system("2016f");
        link_data(before.current.empty() ? "" : install_update(before.current));
        make_link(paths::localtime_link, "/usr/share/zoneinfo/Asia/Tokyo");
        if (before.latest) {
            make_link(paths::latest_link, install_update("2016g.1.0"));
        }
    }
};

} // namespace

TEST_F(faults, never_keep_the_next_start_from_linking_usable_data) {
    for (const state& before : states) {
        std::string disturbed = "none yet";
        for (int number = 0; !disturbed.empty(); ++number) {
            make_device(before);
            disturbed = disturb(number, EIO);
            SCOPED_TRACE(before.current + " with call " + std::to_string(number) + " " + disturbed);
            start();
        }
    }
}

TEST_F(faults, lose_what_the_manual_names_and_no_more_when_the_power_is_cut) {
    std::set<std::string> lost;
    for (const state& before : states) {
        make_device(before);
        entries after_one = start();
        entries after_two = start();
        std::string disturbed = "none yet";
        for (int number = 0; !disturbed.empty(); ++number) {
            make_device(before);
            disturbed = disturb(number, kill_before);
            for (const auto& [path, left] : start()) {
                if (left != after_one[path] && left != after_two[path]) {
                    lost.insert(disturbed + ": " + path + " " + left);
                }
            }
        }
    }
    const std::string icu = paths::icu_link;
    const std::string record = paths::version_record;
    const std::string localtime = paths::localtime_link;
    const std::set<std::string> named = {
        // The next start finds the zoneinfo link switched or reset, and leaves the ICU link alone.
        icu + ": " + icu + " -> /var/db/timezone/tz/2016e.1.0/icutz",
        icu + ": " + icu + " -> /var/db/timezone/tz/2016f.1.1/icutz",
        icu + ": " + icu + " nothing",
        // It finds the new dataset current, and has no switch to write down.
        icu + ": " + record + " nothing",
        paths::cleanup_marker + (": " + record) + " nothing",
        record + ": " + record + " nothing",
        record + ": " + record + " []",
        // It finds no zoneinfo link, resets, and switches from the system dataset.
        paths::zoneinfo_link + (": " + record) + " [2016f.1.0_2016g.1.0]",
        // It finds no local-time link.
        localtime + ": " + localtime + " -> /var/db/timezone/zoneinfo/America/Los_Angeles",
    };
    EXPECT_EQ(lost, named);
}
