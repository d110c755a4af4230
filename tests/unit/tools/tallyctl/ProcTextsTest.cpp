#include "tallyctl/ProcTexts.h"

#include <gtest/gtest.h>

#include "ProcFixtures.h"

namespace tallyd::tallyctl {
namespace {

TEST(ProcTextsTest, AddsUpTheTimesOfAllProcessors) {
  EXPECT_EQ(parseStat(kStatBefore),
            (ProcessorTimes{.user = 1100, .system = 450, .idle = 8000, .iowait = 50, .steal = 10}));
}

TEST(ProcTextsTest, NeedsAWholeProcessorLine) {
  EXPECT_FALSE(parseStat(""));
  EXPECT_FALSE(parseStat("cpu0 1 2 3 4 5 6 7 8\n"));
  EXPECT_FALSE(parseStat("cpu  1 2 3 4 5 6 7\n"));
  EXPECT_FALSE(parseStat("cpu  1 2 3 4 5 6 7 x\n"));
  EXPECT_FALSE(parseStat("cpu  1 2 3 4 5 6 7 -8\n"));
}

TEST(ProcTextsTest, ReadsMemoryInBytes) {
  EXPECT_EQ(parseMeminfo(kMeminfo),
            (MemoryFacts{24684084ULL * 1024, 18513063ULL * 1024, 2097148ULL * 1024, 1048572ULL * 1024}));
}

TEST(ProcTextsTest, TakesFreeMemoryWhereTheAvailableIsNotTold) {
  EXPECT_EQ(parseMeminfo("MemTotal: 10 kB\nMemFree: 4 kB\n"), (MemoryFacts{10240, 4096, 0, 0}));
}

TEST(ProcTextsTest, NeedsTotalAndAvailableMemory) {
  EXPECT_FALSE(parseMeminfo(""));
  EXPECT_FALSE(parseMeminfo("MemTotal: 10 kB\n"));
  EXPECT_FALSE(parseMeminfo("MemAvailable: 10 kB\n"));
  EXPECT_FALSE(parseMeminfo("MemTotal: x kB\nMemFree: 4 kB\n"));
}

TEST(ProcTextsTest, KeepsPhysicalDisksOnly) {
  const auto disks = parseDiskstats(kDiskstatsBefore);
  ASSERT_TRUE(disks);
  EXPECT_EQ(*disks, (std::map<std::string, DiskCounters>{{"nvme0n1", {1000, 20000, 500, 4000}},
                                                         {"sda", {10, 100, 20, 200}},
                                                         {"sda2x", {1, 2, 3, 4}}}));
}

TEST(ProcTextsTest, ReadsAMachineWithoutDisks) {
  EXPECT_TRUE(parseDiskstats("").value().empty());
  EXPECT_FALSE(parseDiskstats("8 0 sda 1 2 3\n"));
  EXPECT_FALSE(parseDiskstats("8 0 sda 1 2 three 4 5 6 7 8\n"));
}

TEST(ProcTextsTest, ReadsInterfacesWithAndWithoutABlankAfterTheirName) {
  const auto interfaces = parseNetDev(kNetDevBefore);
  ASSERT_TRUE(interfaces);
  EXPECT_EQ(*interfaces,
            (std::map<std::string, InterfaceCounters>{{"lo", {10476236, 28813, 0, 10476236, 28813, 0}},
                                                      {"eth0", {4294967000, 621, 1, 33269, 401, 2}},
                                                      {"wlan0", {500, 5, 0, 600, 6, 0}}}));
}

TEST(ProcTextsTest, RefusesABrokenInterfaceLine) {
  EXPECT_FALSE(parseNetDev("eth0 1 2 3 4 5 6 7 8 9 10 11\n"));
  EXPECT_FALSE(parseNetDev("eth0: 1 2 3 4 5 6 7 8 9 10\n"));
  EXPECT_FALSE(parseNetDev("eth0: 1 2 x 4 5 6 7 8 9 10 11\n"));
}

TEST(ProcTextsTest, ReadsLoadAndUptime) {
  EXPECT_EQ(parseLoadavg(kLoadavg), (LoadAverages{2.62, 1.28, 0.56}));
  EXPECT_FALSE(parseLoadavg("2,62 1,28 0,56"));
  EXPECT_FALSE(parseLoadavg("2.62 1.28"));
  EXPECT_EQ(parseUptime(kUptime), 2755.42);
  EXPECT_FALSE(parseUptime("\n"));
  EXPECT_FALSE(parseUptime(""));
}

}  // namespace
}  // namespace tallyd::tallyctl
