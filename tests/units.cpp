// What no device can show. Prints what was seen when that is not what is expected, and ends with 1.
#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "version/mira_version.h"

#include <cerrno>
#include <cstdio>
#include <stdexcept>

constexpr char expected[] = R"(
units: tz_icu::initialize: fts_open of /icutz failed, File name too long: File name too long
error 36
units: mira_icu::compatible_schema: could not dynamic_cast other component: Success
compatible: 0, 1
out of range: 2014c.1.-1
units: Cannot parse version string 2014, results.size() = 0: Success
units: Cannot parse version string 2014: Success
-1.-1.-1
)";

int main() {
    static char text[1 << 18] = "\n";
    stderr = ::fmemopen(text, sizeof text, "a"); // where the warnings go
    try {
        const mira_icu data(std::string(70'000, 'x')); // longer than a walk can hold
    } catch (const int error) {
        std::fprintf(stderr, "error %d\n", error);
    }
    const mira_icu icu("nowhere");
    const mira_zoneinfo zoneinfo("nowhere");
    errno = 0;
    const bool fits = icu.compatible_schema(zoneinfo);
    std::fprintf(stderr, "compatible: %d, %d\n", fits, zoneinfo.compatible_schema(icu));
    mira_version version;
    for (const char* const parsed : {"2014c.1.2147483648", "2014"}) {
        try {
            version.parse(parsed);
        } catch (const std::out_of_range&) {
            std::fputs("out of range: ", stderr);
        }
        std::fprintf(stderr, "%d%s.%d.%d\n", version.year, version.letters.c_str(), version.major,
            version.minor);
    }
    std::fclose(stderr);
    std::string seen = text;
    std::erase(seen, 'x');
    std::fputs(seen == expected ? "passed\n" : seen.c_str(), stdout);
    return seen != expected;
}
