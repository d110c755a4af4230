// What property lists may cost, whoever wrote them.
#pragma once

#include <cstddef>

namespace tallyd::platform {

/// Largest list that is read or written: the library counts bytes in 32 bits.
inline constexpr std::size_t kMaximumPropertyListBytes = std::size_t{1} << 30;

/// A binary list may refer to one object many times, and every reference becomes an object of its own. This
/// is how much larger than the file the result may get: more than what repeated keys and values of real lists
/// come to, and still in proportion to the file.
inline constexpr std::size_t kMaximumExpansion = 64;
inline constexpr std::size_t kExpansionAllowanceBytes = 64 << 10;  ///< For small files, on top.
inline constexpr std::size_t kBytesPerReference = 16;              ///< What one reference counts for in this.

}  // namespace tallyd::platform
