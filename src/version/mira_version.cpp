#include "version/mira_version.h"

#include <regex>

#include <err.h>

namespace {

// A version text has no length limit. The default matcher of libstdc++ recurses for each character
// and overflows the stack; its other one runs in constant stack and linear time. Other libraries
// have a single matcher.
#ifdef __GLIBCXX__
constexpr auto any_length = std::regex_constants::ECMAScript | std::regex_constants::__polynomial;
#else
constexpr auto any_length = std::regex_constants::ECMAScript;
#endif

/// Returns the value of a group of digits, or -1 for a group that took no part in the match.
int number_or_absent(const std::wssub_match& digits) {
    return digits.matched ? std::stoi(digits.str()) : -1;
}

} // namespace

mira_version::mira_version(const std::string& text) {
    parse(text);
}

void mira_version::parse(const std::string& text) {
    // Each byte as a wide character: for each bracket of an expression over `char`, libstdc++ makes
    // a table of all 256 values in advance, which costs more than all the matches of a start.
    const std::wstring bytes(text.begin(), text.end());
    const std::wregex grammar(LR"(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)", any_length);
    std::wsmatch results;
    if (!std::regex_match(bytes, results, grammar)) {
        const int size = static_cast<int>(results.size());
        warn("Cannot parse version string %s, results.size() = %d", text.c_str(), size);
        warn("Cannot parse version string %s", text.c_str());
        *this = mira_version();
        return;
    }
    year = std::stoi(results.str(1));
    letters.assign(results[2].first, results[2].second);
    major = number_or_absent(results[3]);
    minor = number_or_absent(results[4]);
}
