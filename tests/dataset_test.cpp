#include "dataset/dataset_links.h"
#include "dataset/mira_dataset.h"
#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <string>

namespace
{

using dataset = device;
using zoneinfo_link = device;

const std::string root = "/var/db/timezone/tz/";

} // namespace

TEST_F(dataset, of_the_system_takes_its_version_from_its_tree)
{
    check_action([] { EXPECT_EQ(mira_dataset().version(), mira_version()); }, refused(".1.0"));
    install_system("2016f");
    check_action([] {
        const mira_dataset system;
        EXPECT_EQ(system.version_string(), "2016f.1.0");
        EXPECT_EQ(system.version(), mira_version("2016f.1.0"));
        EXPECT_TRUE(system == mira_dataset(""));
    });
}

TEST_F(dataset, takes_its_version_from_its_path)
{
    check_action([] {
        EXPECT_EQ(mira_dataset(root + "2016f").version_string(), "2016f");
        EXPECT_EQ(mira_dataset(root + "2016f").version(), mira_version("2016f"));
    });
    for (const std::string name : {"x", "/", "2016f.1.0/", "2016f.1.0/zoneinfo", "../2016f"}) {
        check_action(
            [&] { EXPECT_EQ(mira_dataset(root + name).version_string(), name); }, refused(name));
    }
    check_action([] { mira_dataset(root + "2147483648a"); }, {}, out_of_range);
}

TEST_F(dataset, lies_below_the_dataset_root)
{
    for (const std::string path : {"/var/db/timezone/tz/", "/var/db/timezone/tz", "2016f.1.0",
             "/var/db/timezone/tzx2016f.1.0", "/usr/share/zoneinfo.default"}) {
        check_action([&] { mira_dataset{path}; },
            {"mira_dataset::create_components: bad path " + path}, badpath);
    }
}

TEST_F(dataset, is_equal_by_path_and_ordered_by_version)
{
    check_action([] {
        const mira_dataset older(root + "2016f.1.0");
        const mira_dataset newer(root + "2016f.1.1");
        const mira_dataset same_version(root + "2016f.01.0");
        EXPECT_TRUE(older == mira_dataset(root + "2016f.1.0"));
        EXPECT_FALSE(older == same_version);
        EXPECT_FALSE(older.newer_than(same_version) || same_version.newer_than(older));
        EXPECT_TRUE(newer.newer_than(older));
        EXPECT_FALSE(older.newer_than(newer));
    });
}

TEST_F(zoneinfo_link, names_the_directory_above_its_tree)
{
    const std::pair<std::string, std::string> accepted[] = {{"/usr/share/zoneinfo.default", ""},
        {root + "2016f.1.0/zoneinfo", root + "2016f.1.0"}, {root + "a/b/x", root + "a/b"},
        {root + "x/", root + "x"}, {root + "//x", root + "/"}};
    for (const auto& [text, directory] : accepted) {
        make_link(paths::zoneinfo_link, text);
        check_action([directory = directory] { EXPECT_EQ(read_current_link(), directory); });
    }
}

TEST_F(zoneinfo_link, with_any_other_text_is_bad)
{
    check_action(read_current_link, {failed("Bad zoneinfo link ", ENOENT)}, -1);
    for (const std::string text :
        {"/usr/share/zoneinfo.default/", "/usr/share/zoneinfo", "../tz/2016f.1.0/zoneinfo",
            "/var/db/timezone/tz/", "/var/db/timezone/tz/2016f.1.0",
            "/var/db/timezone/tz//zoneinfo", "/var/db/timezone/tz//", "/var/db/timezone/tzx/y/z"}) {
        make_link(paths::zoneinfo_link, text);
        check_action(read_current_link, {"Bad zoneinfo link " + text}, -1);
    }
}
