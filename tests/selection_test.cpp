#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <string>

namespace {

const std::string root = "/var/db/timezone/tz/";
const std::string incompatible = "Symlink points at data incompatible with installed system";
const std::string not_taken = "New update not compatible or older version";
const std::string bad_links = "Invalid current symlinks; resetting to system partition";
const std::string no_data = "Unable to locate data; resetting to system partition";
const std::string bad_path = "mira_dataset::create_components: bad path ";

/// A device with the system dataset 2016f of the ICU format 44l and nothing to repair.
class selection : public device {
protected:
    void SetUp() override {
        renew();
        install_system("2016f", "44l");
        link_data("");
        make_link(paths::localtime_link, "/var/db/timezone/zoneinfo/Asia/Tokyo");
    }

    static void check_left(const std::string& dataset, bool marker, const std::string& record) {
        check_data_links(dataset);
        EXPECT_EQ(entry(paths::cleanup_marker), marker ? "[]" : "nothing");
        EXPECT_EQ(entry(paths::version_record), record.empty() ? "nothing" : "[" + record + "]");
    }
};

/// One start with the given updates installed. A dataset is named by its version text, and the
/// system dataset by an empty one.
struct scenario {
    std::string current;
    std::string latest;
    strings warnings;
    std::string current_after;
    bool marker = false;
    std::string record = {};
};

} // namespace

TEST_F(selection, keeps_resets_or_switches) {
    const scenario scenarios[] = {
        // The system dataset is current.
        {"", "", {}, ""},
        {"", "2016g.1.0", {}, "2016g.1.0", false, "2016f.1.0_2016g.1.0"},
        {"", "2016f.1.1", {}, "2016f.1.1", false, "2016f.1.0_2016f.1.1"},
        {"", "2016f.1.0", {not_taken}, ""},
        {"", "2017a.48", {not_taken}, ""},  // of the format 48l
        {"", "2016i.1.0", {not_taken}, ""}, // is not there
        {"", "beta", refused("beta") + strings{not_taken}, ""},
        {"", "2147483648a", {no_data}, ""},
        // An update is current.
        {"2016g.1.0", "", {}, "2016g.1.0"},
        {"2016f.1.0", "", {}, "2016f.1.0"}, // as old as the system's
        {"2016g.1.0", "2016h.1.0", {}, "2016h.1.0", true, "2016g.1.0_2016h.1.0"},
        {"2016g.1.0", "2016g.1.0", {not_taken}, "2016g.1.0"},
        {"2016h.1.0", "2016g.1.0", {not_taken}, "2016h.1.0"},
        // An update is given up: it is older than the system's or of another format.
        {"2016e.1.0", "", {incompatible}, "", true},
        {"2017a.48", "", {incompatible}, "", true},
        {"beta", "", refused("beta") + strings{incompatible}, "", true},
        {"2016e.1.0", "2016g.1.0", {incompatible}, "2016g.1.0", true, "2016f.1.0_2016g.1.0"},
        {"2016d.1.0", "2016e.1.0", {incompatible}, "2016e.1.0", true, "2016f.1.0_2016e.1.0"},
        {"2016i.1.0", "2016h.1.0", {incompatible, not_taken}, "", true}, // is not there, but newer
        {"2017a.48", "2017b.48", {incompatible, not_taken}, "", true},
        {"2147483648a", "", {no_data}, ""},
        // The latest link leads elsewhere.
        {"2016g.1.0", "/usr/x", {bad_path + "/usr/x", no_data}, ""},
        {"2016e.1.0", root, {incompatible, bad_path + root, no_data}, "", true},
    };
    const auto directory = [](const std::string& version) {
        return version.empty() || version.front() == '/' ? version : root + version;
    };
    for (const auto& [current, latest, warnings, current_after, marker, record] : scenarios) {
        SCOPED_TRACE("from " + current + " with " + latest);
        SetUp();
        for (const std::string version : {"2016d.1.0", "2016e.1.0", "2016f.1.0", "2016f.1.1",
                 "2016g.1.0", "2016h.1.0", "beta"}) {
            install_update(version, "44l");
        }
        install_update("2017a.48", "48l");
        install_update("2017b.48", "48l");
        link_data(directory(current));
        if (!latest.empty()) {
            make_link(paths::latest_link, directory(latest));
        }
        check_start(warnings);
        check_left(directory(current_after), marker, record);
    }
}

TEST_F(selection, resets_links_that_are_missing_or_bad) {
    make_link(paths::icu_link, "stale");
    remove_all(paths::zoneinfo_link);
    check_start({failed("Bad zoneinfo link ", ENOENT), bad_links});
    check_left("", false, "");

    make_file(paths::zoneinfo_link);
    check_start({failed("read_symlink: /var/db/timezone/zoneinfo", EINVAL), bad_links});
    check_left("", false, "");

    // A bad link does not keep a newer dataset from being taken.
    const std::string update = install_update("2016g.1.0");
    make_link(paths::zoneinfo_link, "bad");
    make_link(paths::latest_link, update);
    check_start({"Bad zoneinfo link bad", bad_links});
    check_left(update, false, "2016f.1.0_2016g.1.0");
}

TEST_F(selection, resets_when_the_latest_link_is_no_link) {
    link_data(install_update("2016g.1.0"));
    make_file(paths::latest_link);
    check_start(
        {failed("read_symlink: /var/db/timezone/tz_latest", EINVAL), failed(no_data, EINVAL)});
    check_left("", false, "");
}

TEST_F(selection, undoes_a_switch_whose_icu_link_cannot_be_made) {
    const std::string update = install_update("2016g.1.0");
    make_link(paths::latest_link, update);
    make_directory(paths::icu_link);
    const strings not_removed = {failed("remove: could not remove /var/db/icutz", EISDIR),
        failed("unlink of ICU softlink failed", EISDIR)};
    check_start(
        not_removed +
        strings{failed("create_symlink: from /var/db/icutz to " + update + "/icutz", EEXIST),
            failed(no_data, EEXIST)} +
        not_removed);
    EXPECT_EQ(entry(paths::zoneinfo_link), "-> /usr/share/zoneinfo.default");
    EXPECT_EQ(entry(paths::version_record), "nothing");
}

TEST_F(selection, ends_with_1_when_the_system_dataset_cannot_be_made_current) {
    remove_all(paths::localtime_link);
    make_directory(paths::zoneinfo_link);
    const strings reset = {failed("remove: could not remove /var/db/timezone/zoneinfo", EISDIR),
        failed("Unlink of zoneinfo softlink failed", EISDIR),
        failed("create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default",
            EEXIST)};
    check_start(strings{failed("read_symlink: /var/db/timezone/zoneinfo", EINVAL), bad_links} +
                    reset + strings{failed(no_data, EEXIST)} + reset,
        1);

    install_system("2147483648a");
    check_start({no_data}, 1);
    EXPECT_EQ(entry(paths::localtime_link), "nothing");
}

TEST_F(selection, works_with_a_system_of_unknown_version_and_format) {
    remove_all("/usr/share/zoneinfo.default");
    remove_all("/usr/share/icu");
    const std::string update = install_update("2016g.1.0", "");
    make_link(paths::latest_link, update);
    check_start(refused(".1.0") + refused(".1.0")); // the system and the current dataset
    check_left(update, false, ".1.0_2016g.1.0");
}

TEST_F(selection, goes_on_without_the_marker_and_the_record) {
    link_data(install_update("2016g.1.0"));
    make_link(paths::latest_link, install_update("2016h.1.0"));
    make_file(std::string(paths::cleanup_marker) + "/occupied");
    make_directory(paths::version_record);
    check_start({failed("Cannot touch file /var/db/timezone/needs_cleanup", EISDIR)});
    check_data_links(root + "2016h.1.0");
}
