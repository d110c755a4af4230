// Text by Unicode's rules, whatever the locale.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tallyd::platform {

/// All arguments are UTF-8; ill-formed sequences count as the replacement character U+FFFD.

[[nodiscard]] bool isASCII(std::string_view text);

/// Lower case by the Unicode Standard's default mapping.
[[nodiscard]] std::string lowercased(std::string_view text);

/// After default case folding (Unicode Standard, section 3.13): texts that differ only in case fold to the
/// same text.
[[nodiscard]] std::string caseFolded(std::string_view text);

/// Equal after default case folding.
[[nodiscard]] bool equalIgnoringCase(std::string_view a, std::string_view b);

/// Whether `needle` occurs in `haystack` after default case folding of both. An empty needle occurs nowhere.
[[nodiscard]] bool containsIgnoringCase(std::string_view haystack, std::string_view needle);

/// Length in UTF-16 code units.
[[nodiscard]] std::size_t utf16Length(std::string_view text);

}  // namespace tallyd::platform
