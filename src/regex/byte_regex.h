#pragma once

#include <regex>
#include <string>

/// Character traits for expressions that mean bytes: ranges compare byte values, and there are no
/// collating or character classes, so no byte has to be looked up in a locale. With the default
/// traits a bracket asks the locale about each of the 256 bytes when an expression is compiled.
struct byte_regex_traits : std::regex_traits<char> {
    template <typename Iterator>
    std::string transform_primary(Iterator /*first*/, Iterator /*last*/) const {
        return {};
    }

    bool isctype(char /*byte*/, char_class_type /*mask*/) const { return false; }
};

/// An ECMAScript expression over bytes. It must not hold a character class (`\d`, `[:alpha:]`) or
/// an equivalence class (`[=a=]`), which are not told apart.
using byte_regex = std::basic_regex<char, byte_regex_traits>;

/// The flags for an expression that is matched against text without a length limit. The default
/// matcher of libstdc++ recurses once for each character and overflows the stack; its other matcher
/// runs in constant stack and linear time. Other libraries have a single matcher.
#ifdef __GLIBCXX__
inline constexpr auto unlimited_text =
    std::regex_constants::ECMAScript | std::regex_constants::__polynomial;
#else
inline constexpr auto unlimited_text = std::regex_constants::ECMAScript;
#endif
