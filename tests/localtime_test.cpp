#include "app/localtime_link.h"
#include "paths.h"
#include "support/run.h"

#include <cerrno>
#include <string>

#include <sys/mount.h>

namespace
{

class localtime_link : public device
{
protected:
    void SetUp() override
    {
        device::SetUp();
        install_system();
        link_data("");
    }

    const std::string place = paths::localtime_link;
    const std::string default_link = "/var/db/timezone/zoneinfo/America/Los_Angeles";
    const std::string reset = "localtime link invalid; resetting to America/Los_Angeles";
    const std::string correcting = "Correcting localtime link to ";
    const std::string create = "create_symlink: from /var/db/timezone/localtime to ";
};

} // namespace

TEST_F(localtime_link, is_kept_when_it_leads_through_the_zoneinfo_link)
{
    for (const std::string text : {"/var/db/timezone/zoneinfo/No/Zone", "/var/db/timezone/zoneinfo",
             "/var/db/timezone/zoneinfoX"}) {
        make_link(place, text);
        check_action(repair_localtime_link);
        check_link(place, text);
    }
}

TEST_F(localtime_link, is_corrected_when_it_leads_into_the_read_only_tree)
{
    for (const std::string rest : {"", "/Asia/Tokyo", "/Asia/../Asia/Tokyo"}) {
        make_link(place, "/usr/share/zoneinfo" + rest);
        const std::string corrected = "/var/db/timezone/zoneinfo" + rest;
        check_action(repair_localtime_link, {correcting + corrected});
        check_link(place, corrected);
    }
}

TEST_F(localtime_link, is_reset_when_the_zone_does_not_exist)
{
    for (const std::string rest : {"/No/Zone", ".default/Asia/Tokyo", "X"}) {
        make_link(place, "/usr/share/zoneinfo" + rest);
        const std::string corrected = "/var/db/timezone/zoneinfo" + rest;
        check_action(repair_localtime_link, {correcting + corrected, failed(reset, ENOENT)});
        check_link(place, default_link);
    }
}

TEST_F(localtime_link, is_reset_when_it_is_missing_or_has_any_other_text)
{
    check_action(repair_localtime_link, {failed(reset, ENOENT)});
    check_link(place, default_link);
    for (const std::string text : {"../zoneinfo/Asia/Tokyo", "/var/db/timezone/zoneinf", "x",
             "/usr/share/zoneinf", "/var/db/timezone//zoneinfo/Asia/Tokyo"}) {
        make_link(place, text);
        check_action(repair_localtime_link, {reset});
        check_link(place, default_link);
    }
}

TEST_F(localtime_link, is_reset_when_something_else_is_in_its_place)
{
    const strings warnings = {failed("read_symlink: " + place, EINVAL), failed(reset, EINVAL)};
    for (const auto& make : {+[](const std::string& path) { make_file(path); }, &make_directory}) {
        remove_all(place);
        make(place);
        check_action(repair_localtime_link, warnings);
        check_link(place, default_link);
    }
    remove_all(place);
    make_file(place + "/occupied");
    check_action(
        repair_localtime_link, warnings + strings{failed(create + default_link, EEXIST)}, EEXIST);
}

TEST_F(localtime_link, throws_when_even_the_default_link_cannot_be_created)
{
    make_link(place, "/usr/share/zoneinfo/Asia/Tokyo");
    ASSERT_EQ(::mount(nullptr, "/var", nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
    const std::string corrected = "/var/db/timezone/zoneinfo/Asia/Tokyo";
    check_action(repair_localtime_link,
        {correcting + corrected, failed(create + corrected, EEXIST), failed(reset, EEXIST),
            failed(create + default_link, EEXIST)},
        EEXIST);
    check_link(place, "/usr/share/zoneinfo/Asia/Tokyo");
}
