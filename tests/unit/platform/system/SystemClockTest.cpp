#include "platform/system/SystemClock.h"

#include <gtest/gtest.h>

namespace tallyd::platform {
namespace {

TEST(SystemClockTest, GivesTheTimeOfDay) {
  const SystemClock clock;
  const auto before = std::chrono::system_clock::now();
  const auto now = clock.now();
  const auto after = std::chrono::system_clock::now();
  EXPECT_LE(before, now);
  EXPECT_LE(now, after);
}

TEST(SystemClockTest, AgreesWithGettimeofday) {
  const SystemClock clock;
  timeval before{};
  timeval after{};
  ASSERT_EQ(::gettimeofday(&before, nullptr), 0);
  const timeval now = clock.timeOfDay();
  ASSERT_EQ(::gettimeofday(&after, nullptr), 0);
  const auto microseconds = [](const timeval& time) { return time.tv_sec * 1'000'000 + time.tv_usec; };
  EXPECT_LE(microseconds(before), microseconds(now));
  EXPECT_LE(microseconds(now), microseconds(after));
}

}  // namespace
}  // namespace tallyd::platform
