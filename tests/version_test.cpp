#include "version/mira_version.h"
#include "warnings.h"

#include <stdexcept>
#include <string>
#include <tuple>
#include <vector>

namespace {

using fields = std::tuple<int, std::string, int, int>;

fields fields_of(const mira_version& version) {
    return {version.year, version.letters, version.major, version.minor};
}

} // namespace

TEST(version, is_parsed_from_a_text) {
    const std::string letters(100'000, 'f');
    const std::string zeros(100'000, '0');
    const std::pair<std::string, fields> texts[] = {
        {"2016f.1.0", {2016, "f", 1, 0}},
        {"2014a", {2014, "a", -1, -1}},
        {"2014a.3", {2014, "a", 3, -1}},
        {"0099az.007.010", {99, "az", 7, 10}},
        {"2147483647a.2147483647.2147483647", {2147483647, "a", 2147483647, 2147483647}},
        {"2016" + letters, {2016, letters, -1, -1}},
        {zeros + "7a." + zeros, {7, "a", 0, -1}},
    };
    for (const auto& [text, expected] : texts) {
        mira_version version("1b.2.3");
        EXPECT_EQ(warnings([&, text = text] { version.parse(text); }), "");
        EXPECT_EQ(fields_of(version), expected);
    }
}

TEST(version, is_unset_by_a_text_that_is_refused) {
    const std::string upper_case = "2016" + std::string(100'000, 'A');
    for (const std::string text : {"", "2014", "a", "a2014", "2014A", "2014aA", "2014a.", "2014a.b",
             "2014a.1b", "2014a.1.", "2014a1", "2014a.1.0.2", "2014a..1", "2014a+1", "2014a.1+0",
             " 2014a", "2014a ", "2014a\n", "+2014a", "2014a.-1", "2014\xe9", "2014`", "2014{",
             "201/a", "201:a", "2014a./", "2014a.1.:", upper_case.c_str()}) {
        mira_version version("1b.2.3");
        const std::string refused = "Cannot parse version string " + text;
        EXPECT_EQ(warnings([&] { version.parse(text); }),
            warning(refused + ", results.size() = 0") + warning(refused));
        EXPECT_EQ(fields_of(version), fields(-1, "", -1, -1)) << text;
    }
    EXPECT_EQ(fields_of(mira_version()), fields(-1, "", -1, -1));
}

TEST(version, throws_on_a_number_above_2147483647) {
    mira_version version;
    for (const std::string text : {"2014c.1.2147483648", "2015d.99999999999", "2147483648a"}) {
        EXPECT_THROW(version.parse(text), std::out_of_range);
    }
    EXPECT_EQ(fields_of(version), fields(2015, "d", 1, -1)); // each as far as it came
}

TEST(version, is_ordered_by_year_letters_and_numbers) {
    std::vector<mira_version> ascending = {mira_version()};
    for (const std::string text : {"0a", "2014a", "2014a.0", "2014a.1", "2014a.1.0", "2014a.1.9",
             "2014a.2", "2014a.10", "2014aa", "2014b", "2014z.9.9", "2015a", "10000a"}) {
        ascending.emplace_back(text);
    }
    for (const mira_version& left : ascending) {
        for (const mira_version& right : ascending) {
            EXPECT_EQ(left.newer_than(right), &left > &right);
            EXPECT_EQ(left == right, &left == &right);
        }
    }
}
