#include "app/localtime_link.h"
#include "paths.h"
#include "support/observe.h"

#include <cerrno>
#include <string>

namespace
{

class localtime_link : public device
{
protected:
    void SetUp() override
    {
        device::SetUp();
        install_system("2016f", "44l");
        make_link(paths::zoneinfo_link, paths::system_zoneinfo);
    }
};

const std::string local_link = paths::localtime_link;
const std::string default_link = "/var/db/timezone/zoneinfo/America/Los_Angeles";
const std::string reset = "localtime link invalid; resetting to America/Los_Angeles";
const std::string correcting = "Correcting localtime link to ";

} // namespace

TEST_F(localtime_link, is_left_alone_when_it_leads_through_the_zoneinfo_link)
{
    for (const std::string rest : {"/Asia/Tokyo", "/No/Zone", "", "X"}) {
        make_link(local_link, "/var/db/timezone/zoneinfo" + rest);
        check_action(repair_localtime_link);
        check_link(local_link, "/var/db/timezone/zoneinfo" + rest);
    }
}

TEST_F(localtime_link, is_corrected_when_it_leads_into_the_read_only_tree)
{
    for (const std::string rest : {"/Asia/Tokyo", "", "/../zoneinfo/Asia"}) {
        make_link(local_link, "/usr/share/zoneinfo" + rest);
        const std::string corrected = "/var/db/timezone/zoneinfo" + rest;
        if (rest == "/../zoneinfo/Asia") {
            make_file("/usr/share/zoneinfo/Asia");
        }
        check_action(repair_localtime_link, {correcting + corrected});
        check_link(local_link, corrected);
    }
}

TEST_F(localtime_link, is_reset_when_the_corrected_zone_does_not_exist)
{
    for (const std::string rest : {"/No/Zone", ".default/Asia/Tokyo", "X"}) {
        make_link(local_link, "/usr/share/zoneinfo" + rest);
        check_action(
            repair_localtime_link,
            {correcting + "/var/db/timezone/zoneinfo" + rest, failed(reset, ENOENT)}
        );
        check_link(local_link, default_link);
    }
}

TEST_F(localtime_link, is_reset_when_it_has_any_other_text)
{
    check_action(repair_localtime_link, {failed(reset, ENOENT)});
    check_link(local_link, default_link);
    for (const std::string text :
         {"../zoneinfo/Asia/Tokyo", "/var/db/timezone/zoneinf", "/usr/share/zoneinf", "x",
          "/var/db/timezone//zoneinfo/Asia/Tokyo", "/etc/localtime"}) {
        make_link(local_link, text);
        check_action(repair_localtime_link, {reset});
        check_link(local_link, default_link);
    }
}

TEST_F(localtime_link, is_reset_when_something_else_is_in_its_place)
{
    const strings warnings = {failed("read_symlink: " + local_link, EINVAL), failed(reset, EINVAL)};
    make_file(local_link);
    check_action(repair_localtime_link, warnings);
    check_link(local_link, default_link);

    ASSERT_EQ(std::remove(local_link.c_str()), 0);
    make_directory(local_link);
    check_action(repair_localtime_link, warnings);
    check_link(local_link, default_link);
}

TEST_F(localtime_link, throws_when_even_the_default_link_cannot_be_created)
{
    const std::string create = "create_symlink: from " + local_link + " to ";
    make_file(local_link + "/occupied");
    check_action(
        repair_localtime_link,
        {failed("read_symlink: " + local_link, EINVAL), failed(reset, EINVAL),
         failed(create + default_link, EEXIST)},
        "int " + std::to_string(EEXIST)
    );

    ASSERT_EQ(std::remove((local_link + "/occupied").c_str()), 0);
    ASSERT_EQ(std::remove(local_link.c_str()), 0);
    make_link(local_link, "/usr/share/zoneinfo/Asia/Tokyo");
    make_read_only("/var");
    const std::string corrected = "/var/db/timezone/zoneinfo/Asia/Tokyo";
    check_action(
        repair_localtime_link,
        {correcting + corrected, failed(create + corrected, EEXIST), failed(reset, EEXIST),
         failed(create + default_link, EEXIST)},
        "int " + std::to_string(EEXIST)
    );
    check_link(local_link, "/usr/share/zoneinfo/Asia/Tokyo");
}
