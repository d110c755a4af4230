// The short form of scripts/soak: ten thousand clients at once, and a busy device's day in one go.

#include <gtest/gtest.h>

#include <cstdio>

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
      "MiB in the second and the last tenth, %.1f MiB after\n",
      result.name.c_str(), result.connections, static_cast<std::uintmax_t>(result.sessions),
      static_cast<std::uintmax_t>(result.messages), result.seconds,
      static_cast<double>(result.before.residentBytes) / kMebibyte, result.secondTenthBytes() / kMebibyte,
      result.lastTenthBytes() / kMebibyte, static_cast<double>(result.after.residentBytes) / kMebibyte);
}

TEST(LoadTest, HoldsTenThousandConnectionsWhileAThousandSend) {
  const Crowd crowd = Crowd::withinLimits();
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
