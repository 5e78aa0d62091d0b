// What no device can show. CMakeLists.txt has the output that is expected.
#include "components/mira_icu.h"
#include "components/mira_zoneinfo.h"
#include "version/mira_version.h"

#include <cstdio>

int main() {
    const mira_icu icu("nowhere");
    const mira_zoneinfo zoneinfo("nowhere");
    std::printf("ICU data reads a tz database: %d\n", icu.compatible_schema(zoneinfo));
    try {
        const mira_icu data(std::string(70'000, 'x')); // longer than a walk can hold
    } catch (const int error) {
        std::printf("ICU data with a path too long: error %d\n", error);
    }
    mira_version version("1b.2.3");
    version.parse("2014");
    std::printf("a refused version is unset: %d\n", version == mira_version());
    try {
        version.parse("2014c.1.2147483648");
    } catch (...) {
        std::printf("before the number out of range: %d%s.%d.%d\n", version.year,
            version.letters.c_str(), version.major, version.minor);
    }
}
