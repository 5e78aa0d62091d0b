#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <filesystem>
#include <string>

namespace
{

using zoneinfo = device;
using icu = device;

const std::string dataset = "/var/db/timezone/tz/2016f.1.0";
const std::string icu_directory = dataset + "/icutz/";

/// Checks the format of the data in `dataset` beside a system of that format and of another.
void check_format(const std::string& format)
{
    for (const std::string& system : {format, format + "x"}) {
        make_file("/usr/share/icu/icutzformat.txt", system);
        check_action([&] {
            EXPECT_EQ(mira_icu(dataset).compatible_schema(mira_icu()), system == format) << system;
        });
    }
}

} // namespace

TEST_F(zoneinfo, version_is_the_first_word_of_its_file)
{
    const std::string long_word(70'000, 'x');
    const std::pair<std::string, std::string> contents[] = {{"2016f\n", "2016f"},
        {" \t\v\f\r\n2016f extra\n", "2016f"}, {"*\x01\xff", "*\x01\xff"},
        {long_word + "\vy", long_word}, {"", ""}, {" \n\t", ""}};
    for (const auto& [content, word] : contents) {
        make_file("/usr/share/zoneinfo.default/+VERSION", content);
        make_file(dataset + "/zoneinfo/+VERSION", content + " ");
        check_action([word = word] {
            EXPECT_EQ(mira_zoneinfo().version_string(), word);
            EXPECT_EQ(mira_zoneinfo(dataset).version_string(), word);
        });
    }
    make_directory("/var/x/zoneinfo/+VERSION");
    check_action([] { EXPECT_EQ(mira_zoneinfo("/var/x").version_string(), ""); });
    check_action([] { EXPECT_EQ(mira_zoneinfo("/var/missing").version_string(), ""); });
}

TEST_F(zoneinfo, tries_the_new_link_when_the_old_one_cannot_be_removed)
{
    make_directory(paths::zoneinfo_link);
    check_action([] { mira_zoneinfo(dataset).make_current(); },
        {failed("remove: could not remove /var/db/timezone/zoneinfo", EISDIR),
            failed("Unlink of zoneinfo softlink failed", EISDIR),
            failed("create_symlink: from /var/db/timezone/zoneinfo to " + dataset + "/zoneinfo",
                EEXIST)},
        EEXIST);
}

TEST_F(icu, tries_the_new_link_when_the_old_one_cannot_be_removed)
{
    make_directory(paths::icu_link);
    const strings not_removed = {failed("remove: could not remove /var/db/icutz", EISDIR),
        failed("unlink of ICU softlink failed", EISDIR)};
    check_action([] { mira_icu().make_current(); }, not_removed);
    check_action([] { mira_icu(dataset).make_current(); },
        not_removed +
            strings{failed("create_symlink: from /var/db/icutz to " + dataset + "/icutz", EEXIST)},
        EEXIST);
}

TEST_F(icu, format_of_the_system_is_the_first_word_of_its_file)
{
    make_file(icu_directory + "icutz44l.dat");
    for (const std::string content : {"44l", " \n44l and more\n"}) {
        make_file("/usr/share/icu/icutzformat.txt", content);
        check_action([] { EXPECT_TRUE(mira_icu(dataset).compatible_schema(mira_icu())); });
    }
}

TEST_F(icu, format_is_in_the_name_of_a_regular_file_that_everyone_may_read)
{
    check_format("");
    for (const std::string name : {"icutz44L.dat", "icutz44x.dat", "icutzl.dat", "icutz44.dat",
             "icutz44l.dat.bak", "xicutz44l.dat", "icutz44l.DAT", "icutz44lxdat", "icutz/l.dat",
             "icutz:l.dat", "icutz4\xb2l.dat", "below/icutz44l.dat", "below/below/icutz44l.dat"}) {
        make_file(icu_directory + name);
    }
    make_file(icu_directory + "icutz45l.dat", "", 0770);
    make_file("/var/icutz46l.dat");
    make_link(icu_directory + "icutz46l.dat", "/var/icutz46l.dat");
    make_directory(icu_directory + "icutz47l.dat");
    check_format("");
    for (const std::string format : {"44l", "2015b", "0e", "9l"}) {
        make_file(icu_directory + "icutz" + format + ".dat", "", 0004);
        check_format(format);
        remove_all(icu_directory + "icutz" + format + ".dat");
    }
}

TEST_F(icu, format_is_that_of_the_first_file_that_the_directory_lists)
{
    for (const std::string format : {"44l", "45b", "46e"}) {
        make_file(icu_directory + "icutz" + format + ".dat");
    }
    const std::filesystem::directory_iterator first(icu_directory);
    check_format(first->path().filename().string().substr(5, 3));
}

TEST_F(icu, directory_may_be_a_link)
{
    make_file("/var/elsewhere/icutz44l.dat");
    make_link(dataset, "/var");
    make_link("/var/icutz", "elsewhere");
    check_format("44l");
    make_link("/var/icutz", "icutz");
    check_format("");
}

TEST_F(icu, is_compatible_with_icu_data_only)
{
    check_action([] { EXPECT_FALSE(mira_icu().compatible_schema(mira_zoneinfo())); },
        {"mira_icu::compatible_schema: could not dynamic_cast other component"});
    check_action([] { EXPECT_TRUE(mira_zoneinfo().compatible_schema(mira_icu())); });
}
