#include "app/localtime_link.h"
#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <string>

#include <sys/mount.h>

namespace {

using localtime_link = device;

const std::string place = paths::localtime_link;
const std::string default_link = "/var/db/timezone/zoneinfo/America/Los_Angeles";
const std::string reset = "localtime link invalid; resetting to America/Los_Angeles";
const std::string correcting = "Correcting localtime link to ";
const std::string create = "create_symlink: from /var/db/timezone/localtime to ";

} // namespace

TEST_F(localtime_link, is_kept_corrected_or_reset) {
    install_system();
    link_data("");
    const std::string zones = "/var/db/timezone/zoneinfo";
    const struct {
        std::string before;
        strings warnings;
        std::string after;
    } links[] = {
        {zones + "/No/Zone", {}, zones + "/No/Zone"},
        {zones, {}, zones},
        {zones + "X", {}, zones + "X"},
        {"/usr/share/zoneinfo/Asia/Tokyo", {correcting + zones + "/Asia/Tokyo"},
            zones + "/Asia/Tokyo"},
        {"/usr/share/zoneinfo", {correcting + zones}, zones},
        {"/usr/share/zoneinfo/No/Zone", {correcting + zones + "/No/Zone", failed(reset, ENOENT)},
            default_link},
        {"/usr/share/zoneinfo.default/Asia/Tokyo",
            {correcting + zones + ".default/Asia/Tokyo", failed(reset, ENOENT)}, default_link},
        {"/usr/share/zoneinf", {reset}, default_link},
        {"/var/db/timezone/zoneinf", {reset}, default_link},
        {"/var/db/timezone//zoneinfo/Asia/Tokyo", {reset}, default_link},
        {"../zoneinfo/Asia/Tokyo", {reset}, default_link},
    };
    for (const auto& [before, warnings, after] : links) {
        make_link(place, before);
        check_action(repair_localtime_link, warnings);
        EXPECT_EQ(entry(place), "-> " + after);
    }
    remove_all(place);
    check_action(repair_localtime_link, {failed(reset, ENOENT)});
    EXPECT_EQ(entry(place), "-> " + default_link);
}

TEST_F(localtime_link, takes_the_place_of_a_file_or_an_empty_directory) {
    for (const auto& make : {+[] { make_file(place); }, +[] { make_directory(place); }}) {
        make();
        check_action(repair_localtime_link,
            {failed("read_symlink: " + place, EINVAL), failed(reset, EINVAL)});
        EXPECT_EQ(entry(place), "-> " + default_link);
    }
}

TEST_F(localtime_link, throws_when_even_the_default_link_cannot_be_created) {
    install_system();
    link_data("");
    make_link(place, "/usr/share/zoneinfo/Asia/Tokyo");
    ASSERT_EQ(::mount("tmpfs", "/var", "tmpfs", MS_REMOUNT | MS_RDONLY, nullptr), 0);
    const std::string corrected = "/var/db/timezone/zoneinfo/Asia/Tokyo";
    check_action(repair_localtime_link,
        {correcting + corrected, failed(create + corrected, EEXIST), failed(reset, EEXIST),
            failed(create + default_link, EEXIST)},
        EEXIST);
}
