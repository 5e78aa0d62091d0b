#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/types.h>

using strings = std::vector<std::string>;

/// A fresh device for each test, at the real absolute paths: an empty "/usr/share" and a "/var"
/// with an empty "/var/db/timezone/tz", mounted in a namespace of the test's own. Where that is
/// refused, the process ends at once with a failure, before anything of the machine is touched.
class device : public testing::Test {
protected:
    void SetUp() override { renew(); }

    /// Puts an empty device in place of the one so far.
    void renew();
};

/// Each makes an entry in place of the one that is there, and the directories above it.
void make_file(const std::string& path, const std::string& content = {}, mode_t mode = 0644);
void make_directory(const std::string& path);
void make_link(const std::string& path, const std::string& text);
void remove_all(const std::string& path);

/// Puts a dataset on the system partition: "+VERSION", the zone Asia/Tokyo and the ICU format.
void install_system(const std::string& version = "2016f", const std::string& format = "44l");
/// Installs an update, without ICU data where the format is empty, and returns its directory.
std::string install_update(const std::string& version, const std::string& format = "44l");
/// Links the data of the dataset in the directory `dataset`, or of the system where it is empty.
void link_data(const std::string& dataset);

/// Returns what is at `path`: "-> " and a link's text, a file's content in brackets, "directory",
/// or "nothing".
std::string entry(const std::string& path);
/// Checks that the data links are as `link_data` makes them.
void check_data_links(const std::string& dataset);
