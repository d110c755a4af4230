// A datagram as a line that people read.
#pragma once

#include <string>
#include <string_view>

namespace tallyd {

/// The longest line, in bytes.
inline constexpr std::size_t kMaximumLocalLogBytes = 1151;

/// The line that stands for `datagram`, read back out of its bytes, of which there must be at least a whole
/// header. What is no UTF-8, such as a letter that the datagram's end cuts, becomes U+FFFD. A letter that
/// does not fit whole into the longest line is left out.
[[nodiscard]] std::string writeLocalLog(std::string_view datagram);

}  // namespace tallyd
