#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "paths.h"
#include "support/observe.h"

#include <cerrno>
#include <filesystem>
#include <string>

namespace
{

using zoneinfo = device;
using icu = device;

const std::string dataset = "/var/db/timezone/tz/2016f.1.0";

/// Checks the format that the ICU component of `dataset` finds, by comparing it with a system of
/// that format and with one of another.
void check_format(const std::string& format)
{
    const std::string system_format = std::string(paths::system_icu) + "/icutzformat.txt";
    check_action([&] {
        make_file(system_format, format);
        EXPECT_TRUE(mira_icu(dataset).compatible_schema(mira_icu())) << "not " << format;
        make_file(system_format, "another");
        EXPECT_FALSE(mira_icu(dataset).compatible_schema(mira_icu()));
    });
}

} // namespace

TEST_F(zoneinfo, version_is_the_first_word_of_its_file)
{
    const std::string file = "/+VERSION";
    const struct {
        std::string content;
        std::string word;
    } contents[] = {
        {"2016f\n", "2016f"},
        {"  2016f\nand more\n", "2016f"},
        {"\t\v\f\r\n 2016f extra", "2016f"},
        {"*\x01\xff\n", "*\x01\xff"},
        {std::string(70'000, 'x') + " y", std::string(70'000, 'x')},
        {"", ""},
        {" \n\t", ""},
    };
    for (const auto& [content, word] : contents) {
        make_file(paths::system_zoneinfo + file, content);
        make_file(dataset + "/zoneinfo" + file, content);
        check_action([&] {
            EXPECT_EQ(mira_zoneinfo().version_string(), word);
            EXPECT_EQ(mira_zoneinfo("").version_string(), word);
            EXPECT_EQ(mira_zoneinfo(dataset).version_string(), word);
        });
    }
    make_directory("/var/db/timezone/tz/directory/zoneinfo" + file);
    check_action([] {
        EXPECT_EQ(mira_zoneinfo("/var/db/timezone/tz/directory").version_string(), "");
        EXPECT_EQ(mira_zoneinfo("/var/db/timezone/tz/missing").version_string(), "");
    });
}

TEST_F(zoneinfo, replaces_the_zoneinfo_link)
{
    check_action([] { mira_zoneinfo(dataset).make_current(); });
    check_link(paths::zoneinfo_link, dataset + "/zoneinfo");
    check_action([] { mira_zoneinfo().make_current(); });
    check_link(paths::zoneinfo_link, "/usr/share/zoneinfo.default");
}

TEST_F(zoneinfo, tries_the_new_link_when_the_old_one_cannot_be_removed)
{
    make_directory(paths::zoneinfo_link);
    check_action(
        [] { mira_zoneinfo().make_current(); },
        {failed("remove: could not remove /var/db/timezone/zoneinfo", EISDIR),
         failed("Unlink of zoneinfo softlink failed", EISDIR),
         failed(
             "create_symlink: from /var/db/timezone/zoneinfo to /usr/share/zoneinfo.default", EEXIST
         )},
        "int " + std::to_string(EEXIST)
    );
}

TEST_F(icu, format_of_the_system_is_the_first_word_of_its_file)
{
    make_file(dataset + "/icutz/icutz44l.dat");
    for (const std::string content : {"44l", "44l\n", " \n44l and more\n"}) {
        make_file(std::string(paths::system_icu) + "/icutzformat.txt", content);
        check_action([] {
            EXPECT_TRUE(mira_icu(dataset).compatible_schema(mira_icu()));
            EXPECT_TRUE(mira_icu(dataset).compatible_schema(mira_icu("")));
        });
    }
}

TEST_F(icu, format_is_taken_from_the_name_of_a_data_file)
{
    check_format("");
    make_directory(dataset + "/icutz");
    check_format("");
    // Nothing of this is a data file: names, modes and kinds.
    for (const std::string name :
         {"icutz44L.dat", "icutz44x.dat", "icutzl.dat", "icutz44.dat", "icutz44l.dat.bak",
          "xicutz44l.dat", "icutz44l.DAT", "icutz44lxdat", "icutz4\xb2l.dat", "icutz/l.dat",
          "icutz:l.dat", "below/icutz44l.dat"}) {
        make_file(dataset + "/icutz/" + name);
    }
    make_file(dataset + "/icutz/icutz45l.dat", "", 0640);
    make_link(dataset + "/icutz/icutz46l.dat", "icutz44L.dat");
    make_directory(dataset + "/icutz/icutz47l.dat");
    check_format("");
    for (const std::string format : {"44l", "2015b", "0e", "9l"}) {
        const std::string file = dataset + "/icutz/icutz" + format + ".dat";
        make_file(file, "", 0004);
        check_format(format);
        std::filesystem::remove(file);
    }
}

TEST_F(icu, format_is_that_of_the_first_data_file_that_the_directory_lists)
{
    for (const std::string format : {"44l", "45b", "46e"}) {
        make_file(dataset + "/icutz/icutz" + format + ".dat");
    }
    const std::filesystem::directory_iterator first(dataset + "/icutz");
    check_format(first->path().filename().string().substr(5, 3));
}

TEST_F(icu, directory_is_found_through_a_link_but_not_on_another_file_system)
{
    make_file("/var/elsewhere/icutz44l.dat");
    make_link("/var/loop", "loop");
    make_directory(dataset);
    make_link(dataset + "/icutz", "/var/loop");
    check_format("");
    make_link(dataset + "/icutz", "/var/elsewhere");
    check_format("44l");
}

TEST_F(icu, is_compatible_with_icu_data_only)
{
    check_action(
        [] { EXPECT_FALSE(mira_icu().compatible_schema(mira_zoneinfo())); },
        {"mira_icu::compatible_schema: could not dynamic_cast other component"}
    );
    check_action([] { EXPECT_TRUE(mira_zoneinfo().compatible_schema(mira_icu())); });
}

TEST_F(icu, replaces_the_icu_link_and_the_system_dataset_has_none)
{
    check_action([] { mira_icu(dataset).make_current(); });
    check_link(paths::icu_link, dataset + "/icutz");
    check_action([] { mira_icu(dataset + "x").make_current(); });
    check_link(paths::icu_link, dataset + "x/icutz");
    check_action([] {
        mira_icu().make_current();
        mira_icu().make_current();
    });
    check_nothing_at(paths::icu_link);
}

TEST_F(icu, goes_on_when_the_old_link_cannot_be_removed)
{
    make_directory(paths::icu_link);
    const strings not_removed = {
        failed("remove: could not remove /var/db/icutz", EISDIR),
        failed("unlink of ICU softlink failed", EISDIR),
    };
    check_action([] { mira_icu().make_current(); }, not_removed);

    strings not_created = not_removed;
    not_created.push_back(
        failed("create_symlink: from /var/db/icutz to " + dataset + "/icutz", EEXIST)
    );
    check_action(
        [] { mira_icu(dataset).make_current(); }, not_created, "int " + std::to_string(EEXIST)
    );
}
