#include "tallyctl/MachineSample.h"

#include <algorithm>
#include <cmath>
#include <string_view>
#include <vector>

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kLoopback = "lo";

/// The kernel does not promise that idle and I/O wait times never go back.
double advance(std::uint64_t before, std::uint64_t now) {
  return now > before ? static_cast<double>(now - before) : 0;
}

ProcessorShares sharesBetween(const ProcessorTimes& before, const ProcessorTimes& now) {
  const ProcessorShares ticks{advance(before.user, now.user), advance(before.system, now.system),
                              advance(before.idle, now.idle), advance(before.iowait, now.iowait),
                              advance(before.steal, now.steal)};
  const double all = ticks.user + ticks.system + ticks.idle + ticks.iowait + ticks.steal;
  if (all == 0) return {};
  return {ticks.user / all, ticks.system / all, ticks.idle / all, ticks.iowait / all, ticks.steal / all};
}

/// Counters to rates over one interval.
class Rate {
 public:
  explicit Rate(double seconds) : _seconds(seconds) {}

  [[nodiscard]] double operator()(std::uint64_t before, std::uint64_t now) const {
    return _seconds > 0 ? static_cast<double>(counterAdvance(before, now)) / _seconds : 0;
  }

 private:
  double _seconds;
};

void add(DiskRates& rates, const DiskCounters& before, const DiskCounters& now, const Rate& rate) {
  constexpr auto kBytes = static_cast<double>(kSectorBytes);
  rates.reads += rate(before.reads, now.reads);
  rates.writes += rate(before.writes, now.writes);
  rates.readBytes += rate(before.readSectors, now.readSectors) * kBytes;
  rates.writtenBytes += rate(before.writtenSectors, now.writtenSectors) * kBytes;
}

void add(InterfaceRates& rates, const InterfaceCounters& before, const InterfaceCounters& now,
         const Rate& rate) {
  rates.rxBytes += rate(before.rxBytes, now.rxBytes);
  rates.rxPackets += rate(before.rxPackets, now.rxPackets);
  rates.rxErrors += rate(before.rxErrors, now.rxErrors);
  rates.txBytes += rate(before.txBytes, now.txBytes);
  rates.txPackets += rate(before.txPackets, now.txPackets);
  rates.txErrors += rate(before.txErrors, now.txErrors);
}

double usedShare(const MemoryFacts& memory) {
  if (memory.totalBytes == 0) return 0;
  const auto total = static_cast<double>(memory.totalBytes);
  return std::max(0.0, 1 - static_cast<double>(memory.availableBytes) / total);
}

Value number(double value) { return std::round(value * 1000) / 1000; }

void put(std::vector<Dictionary::Entry>& entries, const std::string& prefix, const InterfaceRates& rates) {
  entries.push_back({prefix + "_rx_bytes_per_second", number(rates.rxBytes)});
  entries.push_back({prefix + "_rx_packets_per_second", number(rates.rxPackets)});
  entries.push_back({prefix + "_rx_errors_per_second", number(rates.rxErrors)});
  entries.push_back({prefix + "_tx_bytes_per_second", number(rates.txBytes)});
  entries.push_back({prefix + "_tx_packets_per_second", number(rates.txPackets)});
  entries.push_back({prefix + "_tx_errors_per_second", number(rates.txErrors)});
}

}  // namespace

std::uint64_t counterAdvance(std::uint64_t before, std::uint64_t now) {
  if (now >= before) return now - before;
  constexpr std::uint64_t kHalf = std::uint64_t{1} << 31;
  constexpr std::uint64_t kRange = std::uint64_t{1} << 32;
  const bool ranOver = before < kRange && now + kRange - before < kHalf;
  return ranOver ? now + kRange - before : now;
}

MachineSample sampleBetween(const MachineCounters& before, const MachineCounters& now, std::uint64_t number) {
  MachineSample sample;
  sample.number = number;
  sample.intervalSeconds = std::chrono::duration<double>(now.time - before.time).count();
  sample.processors = sharesBetween(before.processors, now.processors);
  sample.memory = now.memory;
  sample.memoryUsedShare = usedShare(now.memory);
  sample.load = now.load;
  sample.uptimeSeconds = now.uptimeSeconds;
  const Rate rate(sample.intervalSeconds);
  for (const auto& [name, counters] : now.disks) {
    const auto earlier = before.disks.find(name);
    if (earlier != before.disks.end()) add(sample.disks, earlier->second, counters, rate);
  }
  for (const auto& [name, counters] : now.interfaces) {
    const auto earlier = before.interfaces.find(name);
    if (earlier == before.interfaces.end()) continue;
    add(name == kLoopback ? sample.loopback : sample.network, earlier->second, counters, rate);
  }
  return sample;
}

Dictionary payloadOf(const MachineSample& sample) {
  std::vector<Dictionary::Entry> entries{
      {"number", Value(sample.number)},
      {"interval_seconds", number(sample.intervalSeconds)},
      {"cpu_user", number(sample.processors.user)},
      {"cpu_system", number(sample.processors.system)},
      {"cpu_idle", number(sample.processors.idle)},
      {"cpu_iowait", number(sample.processors.iowait)},
      {"cpu_steal", number(sample.processors.steal)},
      {"memory_total_bytes", Value(sample.memory.totalBytes)},
      {"memory_available_bytes", Value(sample.memory.availableBytes)},
      {"memory_used_share", number(sample.memoryUsedShare)},
      {"swap_total_bytes", Value(sample.memory.swapTotalBytes)},
      {"swap_used_bytes", Value(sample.memory.usedSwapBytes())},
      {"disk_reads_per_second", number(sample.disks.reads)},
      {"disk_writes_per_second", number(sample.disks.writes)},
      {"disk_read_bytes_per_second", number(sample.disks.readBytes)},
      {"disk_written_bytes_per_second", number(sample.disks.writtenBytes)},
      {"load_1_minute", number(sample.load.oneMinute)},
      {"load_5_minutes", number(sample.load.fiveMinutes)},
      {"load_15_minutes", number(sample.load.fifteenMinutes)},
      {"uptime_seconds", number(sample.uptimeSeconds)},
  };
  put(entries, "network", sample.network);
  put(entries, "loopback", sample.loopback);
  return Dictionary(std::move(entries));
}

}  // namespace tallyd::tallyctl
