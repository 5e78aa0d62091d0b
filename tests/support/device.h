#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/types.h>

using strings = std::vector<std::string>;

/// A fresh device for each test, at the real absolute paths: an empty system partition at
/// "/usr/share" and a "/var" with an empty "/var/db/timezone/tz". Both are mounted in a private
/// namespace, so nothing outside the test sees them. Where the kernel refuses the namespace, the
/// test is skipped, or fails when the environment variable CI is set.
class device : public testing::Test
{
protected:
    void SetUp() override;
    void TearDown() override;
};

/// Creates a file, and the directories above it that are missing.
void make_file(const std::string& path, const std::string& content = {}, mode_t mode = 0644);
void make_directory(const std::string& path);
/// Creates a link with the text `text`, in place of the file or link that is there.
void make_link(const std::string& path, const std::string& text);

/// Puts a dataset on the system partition: "+VERSION", the zones America/Los_Angeles and
/// Asia/Tokyo, and the ICU format.
void install_system(const std::string& version, const std::string& format);
/// Installs a dataset with the zone America/Los_Angeles below "/var/db/timezone/tz" and returns its
/// directory. An empty format leaves the ICU data out.
std::string install_update(const std::string& version, const std::string& format);

/// Makes a whole file system read-only; `root` is "/usr/share" or "/var".
void make_read_only(const std::string& root);

void check_link(const std::string& path, const std::string& text);
void check_file(const std::string& path, const std::string& content);
void check_nothing_at(const std::string& path);

/// Checks that the data links name the dataset in the directory `dataset`, or the system dataset
/// when it is empty.
void check_current(const std::string& dataset);
