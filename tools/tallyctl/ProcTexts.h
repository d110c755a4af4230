// Reads the texts of /proc (proc(5); for diskstats the kernel's Documentation/admin-guide/iostats.rst).
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace tallyd::tallyctl {

/// Time of all processors together since the start, in clock ticks.
struct ProcessorTimes {
  std::uint64_t user = 0;    ///< Programs, nice ones included.
  std::uint64_t system = 0;  ///< The kernel, interrupts included.
  std::uint64_t idle = 0;
  std::uint64_t iowait = 0;
  std::uint64_t steal = 0;
  bool operator==(const ProcessorTimes&) const = default;
};

struct MemoryFacts {
  std::uint64_t totalBytes = 0;
  std::uint64_t availableBytes = 0;
  std::uint64_t swapTotalBytes = 0;
  std::uint64_t swapFreeBytes = 0;
  [[nodiscard]] std::uint64_t usedSwapBytes() const {
    return swapTotalBytes > swapFreeBytes ? swapTotalBytes - swapFreeBytes : 0;
  }
  bool operator==(const MemoryFacts&) const = default;
};

/// Since the start.
struct DiskCounters {
  std::uint64_t reads = 0;
  std::uint64_t readSectors = 0;
  std::uint64_t writes = 0;
  std::uint64_t writtenSectors = 0;
  bool operator==(const DiskCounters&) const = default;
};
inline constexpr std::uint64_t kSectorBytes = 512;  ///< In diskstats, whatever the disk's own sectors are.

/// Since the start.
struct InterfaceCounters {
  std::uint64_t rxBytes = 0;
  std::uint64_t rxPackets = 0;
  std::uint64_t rxErrors = 0;
  std::uint64_t txBytes = 0;
  std::uint64_t txPackets = 0;
  std::uint64_t txErrors = 0;
  bool operator==(const InterfaceCounters&) const = default;
};

struct LoadAverages {
  double oneMinute = 0;
  double fiveMinutes = 0;
  double fifteenMinutes = 0;
  bool operator==(const LoadAverages&) const = default;
};

// Each gives nothing when the text is not of the form that the kernel writes. Numbers do not depend on the
// locale.

[[nodiscard]] std::optional<ProcessorTimes> parseStat(std::string_view text);
/// Before Linux 3.14, which has no "MemAvailable", free memory stands in for it.
[[nodiscard]] std::optional<MemoryFacts> parseMeminfo(std::string_view text);
/// Physical disks only: no partitions, and nothing that is made of other disks or of memory.
[[nodiscard]] std::optional<std::map<std::string, DiskCounters>> parseDiskstats(std::string_view text);
[[nodiscard]] std::optional<std::map<std::string, InterfaceCounters>> parseNetDev(std::string_view text);
[[nodiscard]] std::optional<LoadAverages> parseLoadavg(std::string_view text);
[[nodiscard]] std::optional<double> parseUptime(std::string_view text);  ///< Seconds.

}  // namespace tallyd::tallyctl
