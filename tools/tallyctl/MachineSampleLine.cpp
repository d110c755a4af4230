#include <fmt/format.h>

#include "tallyctl/ByteText.h"
#include "tallyctl/MachineSample.h"

namespace tallyd::tallyctl {

namespace {

std::string percent(double share) { return fmt::format("{:.1f}%", share * 100); }

std::string traffic(const InterfaceRates& rates) {
  return fmt::format("rx {}/s {:.0f} pkt/s tx {}/s {:.0f} pkt/s err {:.0f}/s", byteText(rates.rxBytes),
                     rates.rxPackets, byteText(rates.txBytes), rates.txPackets,
                     rates.rxErrors + rates.txErrors);
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
      percent(sample.memoryUsedShare), byteText(memory.totalBytes), byteText(memory.availableBytes),
      byteText(memory.usedSwapBytes()), disks.reads, byteText(disks.readBytes), disks.writes,
      byteText(disks.writtenBytes), traffic(sample.network), traffic(sample.loopback), sample.load.oneMinute);
}

}  // namespace tallyd::tallyctl
