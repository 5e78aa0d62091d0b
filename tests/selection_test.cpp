#include "paths.h"
#include "support/observe.h"
#include "support/program.h"

#include <cerrno>
#include <string>

namespace
{

using selection = device;

const std::string root = "/var/db/timezone/tz/";
const std::string incompatible = "Symlink points at data incompatible with installed system";
const std::string not_taken = "New update not compatible or older version";
const std::string bad_links = "Invalid current symlinks; resetting to system partition";
const std::string no_data = "Unable to locate data; resetting to system partition";

/// One start. The system dataset is 2016f with the ICU format 44l.
struct scenario {
    std::string name;
    /// Version and ICU format of each update that is installed.
    std::vector<std::pair<std::string, std::string>> updates = {};
    /// What is current at the start, as the version of an update; empty for the system dataset.
    std::string current = {};
    /// The text of the latest link, with a version standing for its directory; empty for no link.
    std::string latest = {};
    strings warnings = {};
    std::string current_after = {};
    bool marker = false;
    std::string record = {};
};

strings refused_version(const std::string& text)
{
    const std::string message = "Cannot parse version string " + text;
    return {message + ", results.size() = 0", message};
}

strings operator+(strings left, const strings& right)
{
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

std::string path_of(const std::string& version)
{
    return version.empty() || version.front() == '/' ? version : root + version;
}

void make_current(const std::string& dataset)
{
    make_link(
        paths::zoneinfo_link,
        dataset.empty() ? paths::system_zoneinfo : path_of(dataset) + "/zoneinfo"
    );
    if (!dataset.empty()) {
        make_link(paths::icu_link, path_of(dataset) + "/icutz");
    }
}

/// A device on which nothing has to be repaired, with `current` and `latest` linked.
void prepare(const std::string& current, const std::string& latest = {})
{
    install_system("2016f", "44l");
    make_current(current);
    make_link(paths::localtime_link, "/var/db/timezone/zoneinfo/Asia/Tokyo");
    if (!latest.empty()) {
        make_link(paths::latest_link, path_of(latest));
    }
}

void check_marker_and_record(bool marker, const std::string& record)
{
    if (marker) {
        check_file(paths::cleanup_marker, "");
    } else {
        check_nothing_at(paths::cleanup_marker);
    }
    if (record.empty()) {
        check_nothing_at(paths::version_record);
    } else {
        check_file(paths::version_record, record);
    }
}

} // namespace

TEST_F(selection, keeps_resets_or_switches)
{
    const scenario scenarios[] = {
        {.name = "the system dataset alone"},
        {.name = "a switch from the system dataset",
         .updates = {{"2016g.1.0", "44l"}},
         .latest = "2016g.1.0",
         .current_after = "2016g.1.0",
         .record = "2016f.1.0_2016g.1.0"},
        {.name = "a switch by the last number",
         .updates = {{"2016f.1.1", "44l"}},
         .latest = "2016f.1.1",
         .current_after = "2016f.1.1",
         .record = "2016f.1.0_2016f.1.1"},
        {.name = "a switch from an update",
         .updates = {{"2016g.1.0", "44l"}, {"2016h.1.0", "44l"}},
         .current = "2016g.1.0",
         .latest = "2016h.1.0",
         .current_after = "2016h.1.0",
         .marker = true,
         .record = "2016g.1.0_2016h.1.0"},
        {.name = "nothing new",
         .updates = {{"2016g.1.0", "44l"}},
         .current = "2016g.1.0",
         .latest = "2016g.1.0",
         .warnings = {not_taken},
         .current_after = "2016g.1.0"},
        {.name = "an update as old as the system",
         .updates = {{"2016f.1.0", "44l"}},
         .current = "2016f.1.0",
         .current_after = "2016f.1.0"},
        {.name = "a latest dataset as old as the system",
         .updates = {{"2016f.1.0", "44l"}},
         .latest = "2016f.1.0",
         .warnings = {not_taken}},
        {.name = "a latest dataset of another format",
         .updates = {{"2016g.1.0", "48l"}},
         .latest = "2016g.1.0",
         .warnings = {not_taken}},
        {.name = "a latest dataset that is not there",
         .latest = "2016g.1.0",
         .warnings = {not_taken}},
        {.name = "a current update older than the system",
         .updates = {{"2016e.1.0", "44l"}},
         .current = "2016e.1.0",
         .warnings = {incompatible},
         .marker = true},
        {.name = "a current update of another format",
         .updates = {{"2016g.1.0", "48l"}},
         .current = "2016g.1.0",
         .warnings = {incompatible},
         .marker = true},
        {.name = "a current update that cannot be parsed",
         .updates = {{"beta", "44l"}},
         .current = "beta",
         .warnings = refused_version("beta") + strings{incompatible},
         .marker = true},
        {.name =
             "a current update that is given up, and a latest one that is newer than the system",
         .updates = {{"2016e.1.0", "44l"}, {"2016g.1.0", "44l"}},
         .current = "2016e.1.0",
         .latest = "2016g.1.0",
         .warnings = {incompatible},
         .current_after = "2016g.1.0",
         .marker = true,
         .record = "2016f.1.0_2016g.1.0"},
        {.name = "a latest one newer than the given-up dataset but older than the system",
         .updates = {{"2016d.1.0", "44l"}, {"2016e.1.0", "44l"}},
         .current = "2016d.1.0",
         .latest = "2016e.1.0",
         .warnings = {incompatible},
         .current_after = "2016e.1.0",
         .marker = true,
         .record = "2016f.1.0_2016e.1.0"},
        {.name = "a newer current update is given up, and the latest one is older than it",
         .updates = {{"2016h.1.0", "48l"}, {"2016g.1.0", "44l"}},
         .current = "2016h.1.0",
         .latest = "2016g.1.0",
         .warnings = {incompatible, not_taken},
         .marker = true},
        {.name = "a latest link outside the dataset root",
         .updates = {{"2016g.1.0", "44l"}},
         .current = "2016g.1.0",
         .latest = "/usr/share/zoneinfo.default",
         .warnings =
             {"mira_dataset::create_components: bad path /usr/share/zoneinfo.default", no_data}},
        {.name = "a latest link that resets after the current update was given up",
         .updates = {{"2016e.1.0", "44l"}},
         .current = "2016e.1.0",
         .latest = "/var/db/timezone/tz/",
         .warnings =
             {incompatible, "mira_dataset::create_components: bad path /var/db/timezone/tz/",
              no_data},
         .marker = true},
        {.name = "a version that does not fit", .latest = "2147483648a", .warnings = {no_data}},
    };
    for (const scenario& start : scenarios) {
        SCOPED_TRACE(start.name);
        TearDown();
        SetUp();
        for (const auto& [version, format] : start.updates) {
            install_update(version, format);
        }
        prepare(start.current, start.latest);
        check_start(start.warnings);
        check_current(path_of(start.current_after));
        check_marker_and_record(start.marker, start.record);
        check_link(paths::localtime_link, "/var/db/timezone/zoneinfo/Asia/Tokyo");
    }
}

TEST_F(selection, resets_links_that_are_missing_or_bad)
{
    install_system("2016f", "44l");
    make_link(paths::icu_link, "stale");
    check_start({
        failed("Bad zoneinfo link ", ENOENT),
        bad_links,
        failed("localtime link invalid; resetting to America/Los_Angeles", ENOENT),
    });
    check_current("");
    check_marker_and_record(false, "");
    check_link(paths::localtime_link, "/var/db/timezone/zoneinfo/America/Los_Angeles");

    make_link(paths::zoneinfo_link, "/usr/share/zoneinfo");
    check_start({"Bad zoneinfo link /usr/share/zoneinfo", bad_links});
    check_current("");

    // A bad link does not keep a newer dataset from being taken.
    make_link(paths::zoneinfo_link, "bad");
    make_link(paths::latest_link, install_update("2016g.1.0", "44l"));
    check_start({"Bad zoneinfo link bad", bad_links});
    check_current(root + "2016g.1.0");
    check_marker_and_record(false, "2016f.1.0_2016g.1.0");
}

TEST_F(selection, replaces_the_zoneinfo_link_only_where_a_link_or_file_is)
{
    prepare("");
    ASSERT_EQ(std::remove(paths::zoneinfo_link), 0);
    make_file(paths::zoneinfo_link);
    check_start({failed("read_symlink: /var/db/timezone/zoneinfo", EINVAL), bad_links});
    check_current("");

    ASSERT_EQ(std::remove(paths::zoneinfo_link), 0);
    make_directory(paths::zoneinfo_link);
    const strings not_reset = {
        failed("remove: could not remove /var/db/timezone/zoneinfo", EISDIR),
        failed("Unlink of zoneinfo softlink failed", EISDIR),
        failed(
            "create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default", EEXIST
        ),
    };
    // The reset fails in its own guard's handler and again in the last one: the run is over.
    check_start(
        strings{failed("read_symlink: /var/db/timezone/zoneinfo", EINVAL), bad_links} + not_reset +
            strings{no_data} + not_reset,
        1
    );
}

TEST_F(selection, undoes_a_switch_whose_icu_link_cannot_be_made)
{
    const std::string update = install_update("2016g.1.0", "44l");
    prepare("", "2016g.1.0");
    make_directory(paths::icu_link);
    const strings not_removed = {
        failed("remove: could not remove /var/db/icutz", EISDIR),
        failed("unlink of ICU softlink failed", EISDIR),
    };
    const strings not_created = {
        failed("create_symlink: from /var/db/icutz to " + update + "/icutz", EEXIST),
        failed(no_data, EEXIST),
    };
    check_start(not_removed + not_created + not_removed);
    check_link(paths::zoneinfo_link, paths::system_zoneinfo);
    check_marker_and_record(false, "");
}

TEST_F(selection, resets_when_the_latest_link_is_no_link)
{
    install_update("2016g.1.0", "44l");
    prepare("2016g.1.0");
    make_file(paths::latest_link);
    check_start(
        {failed("read_symlink: /var/db/timezone/tz_latest", EINVAL), failed(no_data, EINVAL)}
    );
    check_current("");
    check_marker_and_record(false, "");
}

TEST_F(selection, ends_when_the_system_dataset_cannot_be_built)
{
    prepare("");
    install_system("2147483648a", "44l");
    check_start({no_data}, 1);
    check_current("");
}

TEST_F(selection, does_not_need_versions_or_formats_of_the_system)
{
    const std::string update = install_update("2016g.1.0", "");
    make_link(paths::latest_link, update);
    make_current("");
    make_link(paths::localtime_link, "/var/db/timezone/zoneinfo/Asia/Tokyo");
    // The system dataset is built twice, and both have the unset version and no format.
    check_start(refused_version(".1.0") + refused_version(".1.0"));
    check_current(update);
    check_marker_and_record(false, ".1.0_2016g.1.0");
}

TEST_F(selection, goes_on_without_the_marker_and_the_record)
{
    install_update("2016g.1.0", "44l");
    install_update("2016h.1.0", "44l");
    prepare("2016g.1.0", "2016h.1.0");
    make_file(std::string(paths::cleanup_marker) + "/occupied");
    make_directory(paths::version_record);
    check_start({failed("Cannot touch file /var/db/timezone/needs_cleanup", EISDIR)});
    check_current(root + "2016h.1.0");
}

TEST_F(selection, overwrites_the_record)
{
    install_update("2016g.1.0", "44l");
    prepare("", "2016g.1.0");
    make_file(paths::version_record, std::string(100, 'x'));
    check_start();
    check_file(paths::version_record, "2016f.1.0_2016g.1.0");
}
