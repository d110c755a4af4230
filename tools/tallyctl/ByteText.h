// Amounts of bytes for people.
#pragma once

#include <cstdint>
#include <string>

namespace tallyd::tallyctl {

/// "512 B", "1.5 MiB": with a binary prefix (IEC 80000-13).
[[nodiscard]] std::string byteText(double bytes);
[[nodiscard]] std::string byteText(std::uint64_t bytes);

}  // namespace tallyd::tallyctl
