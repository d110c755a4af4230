// What the machine did between two readings of its counters.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <string>

#include "platform/Value.h"
#include "tallyctl/ProcTexts.h"

namespace tallyd::tallyctl {

/// One reading.
struct MachineCounters {
  std::chrono::steady_clock::time_point time;
  ProcessorTimes processors;
  MemoryFacts memory;
  std::map<std::string, DiskCounters> disks;
  std::map<std::string, InterfaceCounters> interfaces;
  LoadAverages load;
  double uptimeSeconds = 0;
};

/// All per second.
struct DiskRates {
  double reads = 0;
  double writes = 0;
  double readBytes = 0;
  double writtenBytes = 0;
};

/// All per second.
struct InterfaceRates {
  double rxBytes = 0;
  double rxPackets = 0;
  double rxErrors = 0;
  double txBytes = 0;
  double txPackets = 0;
  double txErrors = 0;
};

/// Shares of all processors' time, from 0 to 1.
struct ProcessorShares {
  double user = 0;
  double system = 0;
  double idle = 0;
  double iowait = 0;
  double steal = 0;
};

struct MachineSample {
  std::uint64_t number = 0;  ///< Running number, from 1.
  double intervalSeconds = 0;
  ProcessorShares processors;
  MemoryFacts memory;
  double memoryUsedShare = 0;  ///< Of the total, from 0 to 1.
  DiskRates disks;             ///< Physical disks together.
  InterfaceRates network;      ///< All interfaces but loopback together.
  InterfaceRates loopback;
  LoadAverages load;
  double uptimeSeconds = 0;
};

/// How far a counter went. One that is behind has either run over at 32 bits or started anew at 0; it is
/// taken to have run over when that makes less than 2^31.
[[nodiscard]] std::uint64_t counterAdvance(std::uint64_t before, std::uint64_t now);

/// Disks and interfaces that are in one reading only do not count. All rates are 0 when no time has passed.
[[nodiscard]] MachineSample sampleBetween(const MachineCounters& before, const MachineCounters& now,
                                          std::uint64_t number);

/// The sample as a message's payload: lower_snake keys, numbers cut to a thousandth.
[[nodiscard]] platform::Dictionary payloadOf(const MachineSample& sample);

/// The sample as one line for people.
[[nodiscard]] std::string lineOf(const MachineSample& sample);

}  // namespace tallyd::tallyctl
