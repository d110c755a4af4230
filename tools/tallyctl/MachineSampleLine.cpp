#include <fmt/format.h>

#include <array>

#include "tallyctl/MachineSample.h"

namespace tallyd::tallyctl {

namespace {

std::string percent(double share) { return fmt::format("{:.1f}%", share * 100); }

/// With a binary prefix (IEC 80000-13).
std::string bytes(double count) {
  constexpr std::array<const char*, 6> kUnits{"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
  constexpr double kStep = 1024;
  std::size_t unit = 0;
  while (count >= kStep && unit + 1 < kUnits.size()) {
    count /= kStep;
    ++unit;
  }
  return fmt::format("{:.{}f} {}", count, unit == 0 ? 0 : 1, kUnits[unit]);
}

std::string bytes(std::uint64_t count) { return bytes(static_cast<double>(count)); }

std::string traffic(const InterfaceRates& rates) {
  return fmt::format("rx {}/s {:.0f} pkt/s tx {}/s {:.0f} pkt/s err {:.0f}/s", bytes(rates.rxBytes),
                     rates.rxPackets, bytes(rates.txBytes), rates.txPackets, rates.rxErrors + rates.txErrors);
}

}  // namespace

std::string lineOf(const MachineSample& sample) {
  const auto& cpu = sample.processors;
  const auto& memory = sample.memory;
  const auto& disks = sample.disks;
  return fmt::format(
      "#{} cpu user {} system {} idle {} iowait {} | memory {} of {} available {} swap {} | "
      "disk read {:.0f}/s {}/s write {:.0f}/s {}/s | net {} | lo {} | load {:.2f}",
      sample.number, percent(cpu.user), percent(cpu.system), percent(cpu.idle), percent(cpu.iowait),
      percent(sample.memoryUsedShare), bytes(memory.totalBytes), bytes(memory.availableBytes),
      bytes(memory.usedSwapBytes()), disks.reads, bytes(disks.readBytes), disks.writes,
      bytes(disks.writtenBytes), traffic(sample.network), traffic(sample.loopback), sample.load.oneMinute);
}

}  // namespace tallyd::tallyctl
