#include "tallyctl/MachineSample.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>

#include "ProcFixtures.h"
#include "platform/JSON.h"

namespace tallyd::tallyctl {
namespace {

using std::chrono::milliseconds;

MachineCounters countersBefore() {
  return {.time = {},
          .processors = parseStat(kStatBefore).value(),
          .memory = parseMeminfo(kMeminfo).value(),
          .disks = parseDiskstats(kDiskstatsBefore).value(),
          .interfaces = parseNetDev(kNetDevBefore).value(),
          .load = parseLoadavg(kLoadavg).value(),
          .uptimeSeconds = 2755.42};
}

MachineCounters countersAfter(milliseconds later) {
  MachineCounters counters = countersBefore();
  counters.time += later;
  counters.processors = parseStat(kStatAfter).value();
  counters.disks = parseDiskstats(kDiskstatsAfter).value();
  counters.interfaces = parseNetDev(kNetDevAfter).value();
  return counters;
}

TEST(MachineSampleTest, CountsOnFromALowerNumberWhereA32BitCounterRanOver) {
  EXPECT_EQ(counterAdvance(10, 25), 15U);
  EXPECT_EQ(counterAdvance(7, 7), 0U);
  EXPECT_EQ(counterAdvance(4294967295U, 0), 1U);
  EXPECT_EQ(counterAdvance(4294967000U, 704), 1000U);
  EXPECT_EQ(counterAdvance(std::uint64_t{1} << 31, 0), std::uint64_t{0});
  EXPECT_EQ(counterAdvance((std::uint64_t{1} << 31) + 1, 0), (std::uint64_t{1} << 31) - 1);
}

TEST(MachineSampleTest, TakesACounterThatStartedAnewFromZero) {
  EXPECT_EQ(counterAdvance(1000, 3), 3U);
  EXPECT_EQ(counterAdvance(std::uint64_t{1} << 40, 12), 12U);
}

TEST(MachineSampleTest, SharesTheProcessorsTime) {
  const auto shares = sampleBetween(countersBefore(), countersAfter(milliseconds(1000)), 1).processors;
  // Of 200 ticks: user 40 and nice 10; system 20, interrupts 3 and 7; idle 110; iowait 10.
  EXPECT_DOUBLE_EQ(shares.user, 0.25);
  EXPECT_DOUBLE_EQ(shares.system, 0.15);
  EXPECT_DOUBLE_EQ(shares.idle, 0.55);
  EXPECT_DOUBLE_EQ(shares.iowait, 0.05);
  EXPECT_DOUBLE_EQ(shares.steal, 0);
}

TEST(MachineSampleTest, TakesATimeThatGoesBackAsNone) {
  auto before = countersBefore();
  auto now = before;
  before.processors.iowait = 60;
  now.processors.iowait = 59;
  now.processors.user += 10;
  const auto shares = sampleBetween(before, now, 1).processors;
  EXPECT_DOUBLE_EQ(shares.iowait, 0);
  EXPECT_DOUBLE_EQ(shares.user, 1);
}

TEST(MachineSampleTest, DividesByTheTimeThatReallyPassed) {
  const auto sample = sampleBetween(countersBefore(), countersAfter(milliseconds(2000)), 1);
  EXPECT_DOUBLE_EQ(sample.intervalSeconds, 2);
  // nvme0n1 and sda together; sdb is new, its counters say nothing of this interval.
  EXPECT_DOUBLE_EQ(sample.disks.reads, 6);
  EXPECT_DOUBLE_EQ(sample.disks.writes, 2);
  EXPECT_DOUBLE_EQ(sample.disks.readBytes, 84 * 512 / 2.0);
  EXPECT_DOUBLE_EQ(sample.disks.writtenBytes, 16 * 512 / 2.0);
}

TEST(MachineSampleTest, KeepsLoopbackApartFromTheNetwork) {
  const auto sample = sampleBetween(countersBefore(), countersAfter(milliseconds(1000)), 1);
  EXPECT_DOUBLE_EQ(sample.loopback.rxBytes, 1000);
  EXPECT_DOUBLE_EQ(sample.loopback.txPackets, 10);
  EXPECT_DOUBLE_EQ(sample.network.rxBytes, 1000 + 200);
  EXPECT_DOUBLE_EQ(sample.network.rxPackets, 10 + 2);
  EXPECT_DOUBLE_EQ(sample.network.rxErrors, 3);
  EXPECT_DOUBLE_EQ(sample.network.txBytes, 1000 + 300);
  EXPECT_DOUBLE_EQ(sample.network.txPackets, 10 + 3);
  EXPECT_DOUBLE_EQ(sample.network.txErrors, 5);
}

TEST(MachineSampleTest, HasNoRatesWhenNoTimeHasPassed) {
  const auto sample = sampleBetween(countersBefore(), countersAfter(milliseconds(0)), 1);
  EXPECT_EQ(sample.network.rxBytes, 0);
  EXPECT_EQ(sample.disks.reads, 0);
  const auto still = sampleBetween(countersBefore(), countersBefore(), 1);
  EXPECT_EQ(still.processors.idle, 0);
}

TEST(MachineSampleTest, SurvivesAMachineThatTellsOfNoMemory) {
  auto now = countersAfter(milliseconds(1000));
  now.memory = {};
  EXPECT_EQ(sampleBetween(countersBefore(), now, 1).memoryUsedShare, 0);
  now.memory = {.totalBytes = 10, .availableBytes = 20, .swapTotalBytes = 1, .swapFreeBytes = 2};
  const auto sample = sampleBetween(countersBefore(), now, 1);
  EXPECT_EQ(sample.memoryUsedShare, 0);
  EXPECT_EQ(payloadOf(sample).integer("swap_used_bytes"), 0);
}

TEST(MachineSampleTest, MakesAFlatPayloadOfNumbers) {
  const auto payload = payloadOf(sampleBetween(countersBefore(), countersAfter(milliseconds(3000)), 17));
  for (const auto& [key, value] : payload) {
    EXPECT_TRUE(value.isInteger() || value.isReal()) << key;
    EXPECT_EQ(key.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789_"), std::string::npos) << key;
  }
  EXPECT_EQ(payload.integer("number"), 17);
  EXPECT_EQ(payload.real("interval_seconds"), 3.0);
  EXPECT_EQ(payload.real("cpu_user"), 0.25);
  EXPECT_EQ(payload.integer("memory_total_bytes"), 24684084LL * 1024);
  EXPECT_EQ(payload.integer("memory_available_bytes"), 18513063LL * 1024);
  EXPECT_EQ(payload.real("memory_used_share"), 0.25);
  EXPECT_EQ(payload.integer("swap_used_bytes"), 1048576LL * 1024);
  EXPECT_EQ(payload.real("network_rx_bytes_per_second"), 400.0);
  EXPECT_EQ(payload.real("network_tx_bytes_per_second"), 433.333);
  EXPECT_EQ(payload.real("loopback_rx_packets_per_second"), 3.333);
  EXPECT_EQ(payload.real("load_15_minutes"), 0.56);
  EXPECT_EQ(payload.real("uptime_seconds"), 2755.42);
  EXPECT_EQ(payload.size(), 32U);
  EXPECT_TRUE(platform::jsonFromValue(payload));
}

TEST(MachineSampleTest, FitsOnOneReadableLine) {
  EXPECT_EQ(lineOf(sampleBetween(countersBefore(), countersAfter(milliseconds(1000)), 3)),
            "#3 cpu user 25.0% system 15.0% idle 55.0% iowait 5.0% | "
            "memory 25.0% of 23.5 GiB available 17.7 GiB swap 1.0 GiB | "
            "disk read 12/s 42.0 KiB/s write 4/s 8.0 KiB/s | "
            "net rx 1.2 KiB/s 12 pkt/s tx 1.3 KiB/s 13 pkt/s err 8/s | "
            "lo rx 1000 B/s 10 pkt/s tx 1000 B/s 10 pkt/s err 0/s | load 2.62");
}

}  // namespace
}  // namespace tallyd::tallyctl
