// What no device can show. Prints what was seen when that is not what is expected, and ends with 1.
#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "version/mira_version.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>

constexpr char expected[] = R"(
units: tz_icu::initialize: fts_open of /icutz failed, File name too long: File name too long
error 36
units: mira_icu::compatible_schema: could not dynamic_cast other component: Success
compatible: 0, 1
1b.2.3
units: Cannot parse version string 2014, results.size() = 0: Success
units: Cannot parse version string 2014: Success
-1.-1.-1
out of range: 2014c.1.-1
out of range: 2015d.1.-1
)";

int main() {
    char* text = nullptr;
    std::size_t size = 0;
    stderr = ::open_memstream(&text, &size); // where the warnings go
    std::fputs("\n", stderr);
    try {
        const mira_icu data(std::string(70'000, 'x')); // longer than a walk can hold
    } catch (const int error) {
        std::fprintf(stderr, "error %d\n", error);
    }
    const mira_icu icu_data("nowhere");
    const mira_zoneinfo zoneinfo_data("nowhere");
    errno = 0;
    const bool icu_fits = icu_data.compatible_schema(zoneinfo_data);
    const bool zoneinfo_fits = zoneinfo_data.compatible_schema(icu_data);
    std::fprintf(stderr, "compatible: %d, %d\n", icu_fits, zoneinfo_fits);
    mira_version version;
    for (const char* const parsed : {"1b.2.3", "2014", "2014c.1.2147483648", "2015d.99999999999"}) {
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
    std::free(text);
    std::erase(seen, 'x');
    std::fputs(seen == expected ? "passed\n" : seen.c_str(), stdout);
    return seen == expected ? 0 : 1;
}
