#include "tallyctl/ByteText.h"

#include <fmt/format.h>

#include <array>
#include <cstddef>

namespace tallyd::tallyctl {

std::string byteText(double bytes) {
  constexpr std::array<const char*, 6> kUnits{"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
  constexpr double kStep = 1024;
  std::size_t unit = 0;
  while (bytes >= kStep && unit + 1 < kUnits.size()) {
    bytes /= kStep;
    ++unit;
  }
  return fmt::format("{:.{}f} {}", bytes, unit == 0 ? 0 : 1, kUnits[unit]);
}

std::string byteText(std::uint64_t bytes) { return byteText(static_cast<double>(bytes)); }

}  // namespace tallyd::tallyctl
