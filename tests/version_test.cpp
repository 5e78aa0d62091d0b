#include "support/observe.h"
#include "version/mira_version.h"

#include <string>

namespace
{

mira_version version(int year, const std::string& letters, int major, int minor)
{
    mira_version fields;
    fields.year = year;
    fields.letters = letters;
    fields.major = major;
    fields.minor = minor;
    return fields;
}

const mira_version unset;

} // namespace

TEST(version, is_parsed_from_a_text)
{
    const struct {
        std::string text;
        mira_version fields;
    } accepted[] = {
        {"2016f.1.0", version(2016, "f", 1, 0)},
        {"2014a", version(2014, "a", -1, -1)},
        {"2014a.3", version(2014, "a", 3, -1)},
        {"0099zz.007.010", version(99, "zz", 7, 10)},
        {"2147483647a", version(2147483647, "a", -1, -1)},
        {"9z.2147483647.2147483647", version(9, "z", 2147483647, 2147483647)},
        {"2016" + std::string(1'000'000, 'f'), version(2016, std::string(1'000'000, 'f'), -1, -1)},
        {std::string(1'000'000, '0') + "7a", version(7, "a", -1, -1)},
    };
    for (const auto& [text, fields] : accepted) {
        SCOPED_TRACE(text.substr(0, 40));
        check_action([&] { EXPECT_EQ(mira_version(text), fields); });
    }
}

TEST(version, is_unset_by_a_refused_text)
{
    const std::string refused[] = {
        "",       "2014",        "a",        "a2014",      "2014A",
        "2014aA", "2014a.",      "2014a.1.", "2014a.b",    "2014a.1b",
        "2014a1", "2014a.1.0.2", "2014a..1", " 2014a",     "2014a ",
        "+2014a", "-1a",         "2014a.-1", "2014a.1.0x", "2014\xe9",
        "2014`",  "2014{",       "2/14a",    "2:14a",      std::string(1'000'000, 'A'),
    };
    for (const std::string& text : refused) {
        SCOPED_TRACE(text.substr(0, 40));
        const std::string message = "Cannot parse version string " + text;
        check_action(
            [&] {
                mira_version parsed = version(1, "a", 2, 3);
                parsed.parse(text);
                EXPECT_EQ(parsed, unset);
            },
            {message + ", results.size() = 0", message}
        );
    }
    // A line end is no part of a version either; it breaks the line of the warning, unchecked here.
    EXPECT_EQ(mira_version("2014a\n"), unset);
}

TEST(version, throws_on_a_number_that_does_not_fit)
{
    mira_version parsed;
    check_action([&] { parsed.parse("2147483648a"); }, {}, "out_of_range");
    check_action([&] { parsed.parse("2014b.99999999999"); }, {}, "out_of_range");
    EXPECT_EQ(parsed, version(2014, "b", -1, -1));
    check_action([&] { parsed.parse("2014c.1.2147483648"); }, {}, "out_of_range");
    EXPECT_EQ(parsed, version(2014, "c", 1, -1));
}

TEST(version, is_ordered)
{
    // Each is newer than those before it.
    const mira_version ascending[] = {
        unset,
        mira_version("0a"),
        mira_version("2014a"),
        mira_version("2014a.0"),
        mira_version("2014a.1"),
        mira_version("2014a.1.0"),
        mira_version("2014a.1.9"),
        mira_version("2014a.2"),
        mira_version("2014a.10.1"),
        mira_version("2014aa"),
        mira_version("2014b"),
        mira_version("2014z.9.9"),
        mira_version("2015a"),
        mira_version("10000a"),
    };
    for (const mira_version& left : ascending) {
        for (const mira_version& right : ascending) {
            EXPECT_EQ(left.newer_than(right), &left > &right);
            EXPECT_EQ(left == right, &left == &right);
        }
    }
    EXPECT_EQ(mira_version("2014a.007"), mira_version("2014a.7"));
}
