#include "dataset/dataset_links.h"
#include "dataset/mira_dataset.h"
#include "fsutil/fsutil.h"
#include "paths.h"
#include "support/run.h"

#include <algorithm>
#include <cerrno>
#include <string>

#include <unistd.h>

namespace {

using links = device;

const std::string root = "/var/db/timezone/tz/";

} // namespace

TEST_F(links, are_read_up_to_1024_bytes) {
    for (const std::size_t length : {1U, 1023U, 1024U, 1025U, 1030U}) {
        make_link("/var/link", std::string(length, 'x'));
        const std::string text(std::min<std::size_t>(length, 1024), 'x');
        check_action([&] { EXPECT_EQ(fsutil::read_symlink("/var/link"), text); });
    }
}

TEST_F(links, fail_with_the_errno_of_the_call_even_when_the_warning_cannot_be_written) {
    const std::pair<int, void (*)()> failures[] = {{EISDIR, [] { fsutil::remove("/var/db"); }},
        {EINVAL, [] { fsutil::read_symlink("/var/db"); }},
        {EEXIST, [] { fsutil::create_symlink("new", "/var/db"); }}};
    for (const auto& [error, action] : failures) {
        check_action(
            [action = action] {
                ::close(STDERR_FILENO);
                action();
            },
            {}, error);
    }
}

TEST_F(links, to_zoneinfo_name_the_directory_above_the_tree) {
    const std::pair<std::string, std::string> accepted[] = {{"/usr/share/zoneinfo.default", ""},
        {root + "2016f.1.0/zoneinfo", root + "2016f.1.0"}, {root + "a/b/x", root + "a/b"},
        {root + "x/", root + "x"}, {root + "//x", root + "/"}};
    for (const auto& [text, directory] : accepted) {
        check_action([text = text, directory = directory] {
            EXPECT_EQ(dataset_path_from_zoneinfo_link(text), directory);
        });
    }
    for (const std::string text :
        {"/usr/share/zoneinfo.default/", "/usr/share/zoneinfo", "../tz/x/y", "/var/db/timezone/tz/",
            "/var/db/timezone/tz/2016f.1.0", "/var/db/timezone/tz//",
            "/var/db/timezone/tz//zoneinfo", "/var/db/timezone/tzx/y/z"}) {
        check_action(
            [&] { dataset_path_from_zoneinfo_link(text); }, {"Bad zoneinfo link " + text}, -1);
    }
}

TEST_F(links, to_datasets_lead_below_the_dataset_root) {
    for (const std::string name : {"x", "/", "2016f.1.0/", "2016f.1.0/zoneinfo", "../2016f"}) {
        check_action(
            [&] { EXPECT_EQ(mira_dataset(root + name).version_string(), name); }, refused(name));
    }
    for (const std::string path : {"/var/db/timezone/tz/", "/var/db/timezone/tz", "2016f.1.0",
             "/var/db/timezone/tzx2016f.1.0", "/usr/share/zoneinfo.default"}) {
        check_action([&] { mira_dataset{path}; },
            {"mira_dataset::create_components: bad path " + path}, badpath);
    }
}
