#include "version/mira_version.h"

#include "regex/byte_regex.h"

#include <err.h>

namespace {

/// Returns the value of a group of digits, or -1 for a group that took no part in the match.
int number_or_absent(const std::ssub_match& digits) {
    return digits.matched ? std::stoi(digits.str()) : -1;
}

} // namespace

mira_version::mira_version(const std::string& text) {
    parse(text);
}

void mira_version::parse(const std::string& text) {
    const byte_regex grammar(R"(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)", unlimited_text);
    std::smatch results;
    if (!std::regex_match(text, results, grammar)) {
        const int size = static_cast<int>(results.size());
        warn("Cannot parse version string %s, results.size() = %d", text.c_str(), size);
        warn("Cannot parse version string %s", text.c_str());
        *this = mira_version();
        return;
    }
    year = std::stoi(results.str(1));
    letters = results.str(2);
    major = number_or_absent(results[3]);
    minor = number_or_absent(results[4]);
}
