#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string>

namespace {

using zoneinfo = device;
using icu = device;

const std::string dataset = "/var/db/timezone/tz/2016f.1.0";
const std::string icu_directory = dataset + "/icutz/";

/// Checks the format of the data in `dataset` beside a system of that format and of another.
void check_format(const std::string& format) {
    for (const std::string& system : {format, format + "x"}) {
        make_file("/usr/share/icu/icutzformat.txt", system.empty() ? "\n" : " " + system + " more");
        check_action([&] {
            EXPECT_EQ(mira_icu(dataset).compatible_schema(mira_icu()), system == format) << system;
        });
    }
}

} // namespace

TEST_F(zoneinfo, version_is_the_first_word_of_its_file) {
    const std::string long_word(70'000, 'x');
    const std::pair<std::string, std::string> contents[] = {{"2016f\n", "2016f"},
        {" \t\v\f\r\n2016f extra\n", "2016f"}, {long_word + "\v\xff", long_word}, {"", ""},
        {" \n\t", ""}};
    for (const auto& [content, word] : contents) {
        make_file("/usr/share/zoneinfo.default/+VERSION", content);
        check_action([word = word] { EXPECT_EQ(mira_zoneinfo().version_string(), word); });
    }
    make_directory(dataset + "/zoneinfo/+VERSION");
    check_action([] { EXPECT_EQ(mira_zoneinfo(dataset).version_string(), ""); });
    make_file(dataset + "/zoneinfo/+VERSION", "2016f");
    check_action([] { EXPECT_EQ(mira_zoneinfo(dataset).version_string(), "2016f"); });
}

TEST_F(icu, format_is_in_the_name_of_a_regular_file_that_everyone_may_read) {
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

TEST_F(icu, format_is_that_of_the_first_file_that_the_directory_lists) {
    for (const std::string format : {"44l", "45b", "46e"}) {
        make_file(icu_directory + "icutz" + format + ".dat");
    }
    const std::filesystem::directory_iterator first(icu_directory);
    check_format(first->path().filename().string().substr(5, 3));
}

TEST_F(icu, directory_may_be_a_link) {
    make_file("/var/elsewhere/icutz44l.dat");
    make_link(dataset + "/icutz", "/var/elsewhere");
    check_format("44l");
    make_link(dataset + "/icutz", "icutz");
    check_format("");
}

TEST_F(icu, directory_that_cannot_be_walked_throws_enametoolong) {
    const std::string path(70'000, 'x'); // longer than the walk can hold
    const std::string text = std::strerror(ENAMETOOLONG);
    check_action([&] { mira_icu{path}; },
        {failed(
            "tz_icu::initialize: fts_open of " + path + "/icutz failed, " + text, ENAMETOOLONG)},
        ENAMETOOLONG);
}

TEST_F(icu, is_compatible_with_icu_data_only) {
    check_action([] { EXPECT_FALSE(mira_icu().compatible_schema(mira_zoneinfo())); },
        {"mira_icu::compatible_schema: could not dynamic_cast other component"});
    check_action([] { EXPECT_TRUE(mira_zoneinfo().compatible_schema(mira_icu())); });
}
