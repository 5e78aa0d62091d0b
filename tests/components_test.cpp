#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "warnings.h"

#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>

#include <stdlib.h>

namespace fs = std::filesystem;

namespace {

/// A directory of its own for a dataset, at first without any data.
struct dataset {
    dataset() { EXPECT_NE(::mkdtemp(path.data()), nullptr); }
    ~dataset() { fs::remove_all(path); }

    void make_file(
        const std::string& name, const std::string& content = {}, int mode = 0644) const {
        fs::create_directories(fs::path(path + name).parent_path());
        std::ofstream(path + name) << content;
        fs::permissions(path + name, fs::perms(mode));
    }

    std::string path = testing::TempDir() + "mira_tests.XXXXXX";
};

/// Checks that the data has the ICU format `format`, none where it is empty.
void check_format(const dataset& data, const std::string& format) {
    const dataset same;
    same.make_file(format.empty() ? "/icutz/none" : "/icutz/icutz" + format + ".dat");
    EXPECT_TRUE(mira_icu(data.path).compatible_schema(mira_icu(same.path))) << format;
    EXPECT_EQ(mira_icu(data.path).compatible_schema(mira_icu(data.path + "/no")), format.empty());
}

} // namespace

TEST(zoneinfo, version_is_the_first_word_of_its_file) {
    const dataset data;
    EXPECT_EQ(mira_zoneinfo(data.path).version_string(), "");
    const std::string long_word(70'000, 'x');
    const std::pair<std::string, std::string> contents[] = {{"2016f\n", "2016f"},
        {" \t\v\f\r\n2016f extra\n", "2016f"}, {long_word + "\v\xff", long_word}, {" \n\t", ""}};
    for (const auto& [content, word] : contents) {
        data.make_file("/zoneinfo/+VERSION", content);
        EXPECT_EQ(mira_zoneinfo(data.path).version_string(), word);
    }
}

TEST(icu, format_is_in_the_name_of_a_regular_file_that_everyone_may_read) {
    const dataset data;
    check_format(data, "");
    for (const std::string name : {"icutz44L.dat", "icutz44x.dat", "icutzl.dat", "icutz44.dat",
             "icutz44l.dat.bak", "xicutz44l.dat", "icut4l.dat", "icutz44l.DAT", "icutz44lxdat",
             "icutz4ldat", "icutz:l.dat", "icutz4\xb2l.dat", "icutz/l.dat", "below/icutz44l.dat"}) {
        data.make_file("/icutz/" + name);
    }
    data.make_file("/icutz/icutz45l.dat", "", 0770);
    fs::create_symlink("icutzl.dat", data.path + "/icutz/icutz46l.dat");
    fs::create_directory(data.path + "/icutz/icutz47l.dat");
    check_format(data, "");
    for (const std::string format : {"44l", "2015b", "0e", "9l"}) {
        const std::string name = "/icutz/icutz" + format + ".dat";
        data.make_file(name, "", 0004);
        check_format(data, format);
        fs::remove(data.path + name);
    }
}

TEST(icu, format_is_that_of_the_first_file_that_the_directory_or_a_link_to_it_lists) {
    const dataset data;
    for (const std::string format : {"44l", "45b", "46e", "47l"}) {
        data.make_file("/elsewhere/icutz" + format + ".dat");
    }
    fs::create_symlink("elsewhere", data.path + "/icutz");
    const fs::directory_iterator first(data.path + "/icutz");
    check_format(data, first->path().filename().string().substr(5, 3));
}

TEST(icu, directory_that_cannot_be_walked_is_an_error) {
    const std::string path(70'000, 'x'); // longer than the walk can hold
    const std::string text = "tz_icu::initialize: fts_open of " + path + "/icutz failed, ";
    EXPECT_EQ(warnings([&] { EXPECT_THROW(mira_icu{path}, int); }),
        warning(text + std::strerror(ENAMETOOLONG), ENAMETOOLONG));
}

TEST(icu, is_compatible_with_icu_data_only) {
    const mira_icu icu_data("nowhere");
    const mira_zoneinfo zoneinfo_data("nowhere");
    EXPECT_EQ(warnings([&] { EXPECT_FALSE(icu_data.compatible_schema(zoneinfo_data)); }),
        warning("mira_icu::compatible_schema: could not dynamic_cast other component"));
    EXPECT_TRUE(zoneinfo_data.compatible_schema(icu_data));
}
