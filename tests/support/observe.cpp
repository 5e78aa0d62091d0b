#include "support/observe.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <sstream>
#include <stdexcept>

#include <sys/mman.h>
#include <unistd.h>

namespace
{

bool is_errno_text(const std::string& text)
{
    for (int error = 0; error < 134; ++error) {
        if (text == std::strerror(error)) {
            return true;
        }
    }
    return false;
}

bool is_warning(const std::string& line, const std::string& expected)
{
    return line == expected ||
           (line.starts_with(expected + ": ") && is_errno_text(line.substr(expected.size() + 2)));
}

} // namespace

std::string failed(const std::string& text, int error)
{
    return text + ": " + std::strerror(error);
}

void check_warnings(const std::string& program, const std::string& output, const strings& expected)
{
    strings lines;
    std::istringstream stream(output);
    for (std::string line; std::getline(stream, line);) {
        const std::string prefix = program + ": ";
        EXPECT_TRUE(line.starts_with(prefix)) << line;
        lines.push_back(line.substr(std::min(line.size(), prefix.size())));
    }
    if (!std::equal(lines.begin(), lines.end(), expected.begin(), expected.end(), is_warning)) {
        EXPECT_EQ(lines, expected);
    }
}

void check_action(
    const std::function<void()>& action, const strings& warnings, const std::string& thrown
)
{
    const scratch_file output;
    const int standard_error = ::dup(STDERR_FILENO);
    ::dup2(output.descriptor(), STDERR_FILENO);
    std::string what;
    try {
        action();
    } catch (int value) {
        what = "int " + std::to_string(value);
    } catch (const std::invalid_argument& error) {
        what = std::string("invalid_argument ") + error.what();
    } catch (const std::out_of_range&) {
        what = "out_of_range";
    }
    ::dup2(standard_error, STDERR_FILENO);
    ::close(standard_error);

    EXPECT_EQ(what, thrown);
    check_warnings(program_invocation_short_name, output.content(), warnings);
}

scratch_file::scratch_file() : descriptor_(::memfd_create("output", MFD_CLOEXEC)) {}

scratch_file::~scratch_file()
{
    ::close(descriptor_);
}

std::string scratch_file::content() const
{
    std::string text;
    char buffer[65536];
    ssize_t count = 0;
    off_t offset = 0;
    while ((count = ::pread(descriptor_, buffer, sizeof buffer, offset)) > 0) {
        text.append(buffer, static_cast<std::size_t>(count));
        offset += count;
    }
    return text;
}
