// The short form of scripts/soak: ten thousand clients at once, and a busy device's day in one go.

#include <gtest/gtest.h>

#include <cstdio>
#include <stdexcept>

#include "load/LoadBench.h"

namespace tallyd::test {
namespace {

constexpr double kMebibyte = 1024 * 1024;

/// Each message, and each session's start and stop record, was sent and arrived; none twice.
void expectEverythingArrived(const LoadResult& result) {
  EXPECT_TRUE(result.balanced);
  EXPECT_EQ(result.accepted, result.messages + 2 * result.sessions);
  EXPECT_EQ(result.sent, result.accepted);
  EXPECT_EQ(result.arrived, result.accepted);
}

void show(const LoadResult& result) {
  std::printf(
      "%s: %zu connections, %ju sessions, %ju messages in %.1f s; memory %.1f MiB before, %.1f and %.1f "
      "MiB early and late, %.1f MiB after\n",
      result.name.c_str(), result.connections, static_cast<std::uintmax_t>(result.sessions),
      static_cast<std::uintmax_t>(result.messages), result.seconds,
      static_cast<double>(result.before.residentBytes) / kMebibyte,
      static_cast<double>(result.earlyBytes()) / kMebibyte,
      static_cast<double>(result.lateBytes()) / kMebibyte,
      static_cast<double>(result.after.residentBytes) / kMebibyte);
}

TEST(LoadTest, SaysHowManyDescriptorsACrowdNeedsWhereThereAreFewer) {
  try {
    takeDescriptorsFor({.connections = 4'000'000'000});
    FAIL() << "no limit";
  } catch (const std::runtime_error& error) {
    EXPECT_NE(std::string(error.what()).find("ulimit -n 4000000200"), std::string::npos) << error.what();
  }
}

/// As sampled over the hours of a run in which every session leaves so much behind.
LoadResult withLeak(std::size_t bytesASession) {
  constexpr std::size_t kAtFirst = std::size_t{20} << 20;
  const Days days;
  LoadResult result;
  for (std::size_t hour = 0; hour < days.hours; ++hour) {
    const std::size_t sessions = hour * (days.postingSessions + days.batchingSessions);
    result.samples.push_back({.residentBytes = kAtFirst + sessions * bytesASession});
  }
  return result;
}

TEST(LoadTest, TakesALeakOfFourKibibytesASessionForOne) {
  EXPECT_TRUE(withLeak(0).hasFlatMemory());
  EXPECT_TRUE(withLeak(256).hasFlatMemory());  // What the allocator's habits may look like.
  EXPECT_FALSE(withLeak(4096).hasFlatMemory());
}

TEST(LoadTest, HoldsTenThousandConnectionsWhileAThousandSend) {
  const Crowd crowd;
  const LoadResult result = LoadBench().run(crowd);
  show(result);
  EXPECT_GE(result.samples.front().descriptors, crowd.connections);
  expectEverythingArrived(result);
  EXPECT_TRUE(result.hasFlatMemory());
  EXPECT_TRUE(result.leavesNothing())
      << result.after.threads << " threads, " << result.after.descriptors << " descriptors";
}

TEST(LoadTest, CarriesABusyDevicesDay) {
  const LoadResult result = LoadBench().run(Days{});
  show(result);
  expectEverythingArrived(result);
  EXPECT_TRUE(result.hasFlatMemory());
  EXPECT_TRUE(result.leavesNothing())
      << result.after.threads << " threads, " << result.after.descriptors << " descriptors";
}

}  // namespace
}  // namespace tallyd::test
