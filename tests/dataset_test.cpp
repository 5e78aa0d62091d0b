#include "dataset/dataset_links.h"
#include "dataset/mira_dataset.h"
#include "paths.h"
#include "support/observe.h"

#include <cerrno>
#include <string>

namespace
{

using dataset = device;
using dataset_links = device;

const std::string root = "/var/db/timezone/tz/";

strings refused_version(const std::string& text)
{
    const std::string message = "Cannot parse version string " + text;
    return {message + ", results.size() = 0", message};
}

} // namespace

TEST_F(dataset, of_the_system_takes_its_version_from_its_tree)
{
    install_system("2016f", "44l");
    check_action([] {
        const mira_dataset system;
        EXPECT_EQ(system.version_string(), "2016f.1.0");
        EXPECT_EQ(system.version(), mira_version("2016f.1.0"));
        EXPECT_TRUE(system == mira_dataset(""));
    });
}

TEST_F(dataset, of_a_system_without_a_version_is_unset)
{
    check_action(
        [] { EXPECT_EQ(mira_dataset().version(), mira_version()); }, refused_version(".1.0")
    );
}

TEST_F(dataset, takes_its_version_from_its_path)
{
    check_action([] {
        const mira_dataset update(root + "2016f.1.0");
        EXPECT_EQ(update.version_string(), "2016f.1.0");
        EXPECT_EQ(update.version(), mira_version("2016f.1.0"));
    });
    for (const std::string name : {"x", "/", "2016f.1.0/", "2016f.1.0/zoneinfo", "../2016f"}) {
        check_action(
            [&] {
                const mira_dataset update(root + name);
                EXPECT_EQ(update.version_string(), name);
                EXPECT_EQ(update.version(), mira_version());
            },
            refused_version(name)
        );
    }
    check_action([] { mira_dataset(root + "2147483648a"); }, {}, "out_of_range");
}

TEST_F(dataset, outside_the_dataset_root_is_refused)
{
    for (const std::string path :
         {"/var/db/timezone/tz/", "/var/db/timezone/tz", "/var/db/timezone/tzx2016f.1.0",
          "/usr/share/zoneinfo.default", "2016f.1.0", "/"}) {
        check_action(
            [&] { mira_dataset{path}; }, {"mira_dataset::create_components: bad path " + path},
            "invalid_argument badpath"
        );
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

TEST_F(dataset, compatible_by_its_icu_format)
{
    install_system("2016f", "44l");
    const std::string readable = install_update("2016g.1.0", "44l");
    const std::string unreadable = install_update("2016h.1.0", "48l");
    const std::string without_data = install_update("2016i.1.0", "");
    check_action([&] {
        const mira_dataset system;
        EXPECT_TRUE(system.compatible_schema(mira_dataset()));
        EXPECT_TRUE(mira_dataset(readable).compatible_schema(system));
        EXPECT_FALSE(mira_dataset(unreadable).compatible_schema(system));
        EXPECT_FALSE(mira_dataset(without_data).compatible_schema(system));
    });
}

TEST_F(dataset, made_current_switches_zoneinfo_before_icu)
{
    const std::string update = install_update("2016g.1.0", "44l");
    check_action([&] { mira_dataset(update).make_current(); });
    check_current(update);

    install_system("2016f", "44l");
    check_action([] { mira_dataset().make_current(); });
    check_current("");

    // The zoneinfo link has been switched when the ICU link cannot be.
    make_directory(paths::icu_link);
    check_action(
        [&] { mira_dataset(update).make_current(); },
        {failed("remove: could not remove /var/db/icutz", EISDIR),
         failed("unlink of ICU softlink failed", EISDIR),
         failed("create_symlink: from /var/db/icutz to " + update + "/icutz", EEXIST)},
        "int " + std::to_string(EEXIST)
    );
    check_link(paths::zoneinfo_link, update + "/zoneinfo");
}

TEST_F(dataset_links, zoneinfo_link_names_the_directory_above_its_tree)
{
    const struct {
        std::string text;
        std::string directory;
    } accepted[] = {
        {"/usr/share/zoneinfo.default", ""},
        {root + "2016f.1.0/zoneinfo", root + "2016f.1.0"},
        {root + "2016f.1.0/", root + "2016f.1.0"},
        {root + "a/b/zoneinfo", root + "a/b"},
        {root + "x/", root + "x"},
        {root + "//x", root + "/"},
    };
    for (const auto& [text, directory] : accepted) {
        make_link(paths::zoneinfo_link, text);
        check_action([&] { EXPECT_EQ(read_current_link(), directory); });
    }
}

TEST_F(dataset_links, zoneinfo_link_with_any_other_text_is_bad)
{
    check_action(read_current_link, {failed("Bad zoneinfo link ", ENOENT)}, "int -1");
    for (const std::string text :
         {"/usr/share/zoneinfo.default/", "/usr/share/zoneinfo", "/usr/share/zoneinfo.defaul",
          "../tz/2016f.1.0/zoneinfo", "/var/db/timezone/tz/", "/var/db/timezone/tz/2016f.1.0",
          "/var/db/timezone/tz//zoneinfo", "/var/db/timezone/tz//",
          "/var/db/timezone/tzx/2016f/z"}) {
        make_link(paths::zoneinfo_link, text);
        check_action(read_current_link, {"Bad zoneinfo link " + text}, "int -1");
    }
}

TEST_F(dataset_links, latest_link_is_returned_as_it_stands)
{
    check_action([] { EXPECT_EQ(read_latest_link(), ""); });
    for (const std::string text :
         {"/usr/share/zoneinfo.default", "../x", "/var/db/timezone/tz/y"}) {
        make_link(paths::latest_link, text);
        check_action([&] { EXPECT_EQ(read_latest_link(), text); });
    }
}

TEST_F(dataset_links, what_is_no_link_throws_einval)
{
    make_file(paths::latest_link);
    make_directory(paths::zoneinfo_link);
    check_action(
        read_latest_link, {failed("read_symlink: /var/db/timezone/tz_latest", EINVAL)},
        "int " + std::to_string(EINVAL)
    );
    check_action(
        read_current_link, {failed("read_symlink: /var/db/timezone/zoneinfo", EINVAL)},
        "int " + std::to_string(EINVAL)
    );
}
