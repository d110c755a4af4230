#include "station/LossyPath.h"

#include <gtest/gtest.h>

#include "station/Limits.h"

namespace tallyd::station {

using std::chrono::milliseconds;

namespace {

const Share kAll = Share::ofPercentage("100").value();
constexpr LossyPath::TimePoint kStart{};

std::string textOf(const std::vector<Packet>& packets) {
  std::string text;
  for (const Packet& packet : packets) text += packet.bytes;
  return text;
}

}  // namespace

TEST(LossyPathTest, LetsEverythingThroughAtOnceByDefault) {
  LossyPath path({}, milliseconds(0), 1);
  EXPECT_EQ(path.nextDue(), std::nullopt);
  EXPECT_TRUE(path.put({"a"}, kStart));
  EXPECT_TRUE(path.put({"b"}, kStart));
  EXPECT_EQ(path.nextDue(), kStart);
  EXPECT_EQ(textOf(path.take(kStart)), "ab");
  EXPECT_EQ(path.nextDue(), std::nullopt);
  EXPECT_EQ(path.lost(), 0U);
}

TEST(LossyPathTest, LosesAndCounts) {
  LossyPath path({.lost = kAll}, milliseconds(0), 1);
  EXPECT_FALSE(path.put({"a"}, kStart));
  EXPECT_EQ(textOf(path.take(kStart)), "");
  EXPECT_EQ(path.lost(), 1U);
}

TEST(LossyPathTest, HoldsPacketsUntilTheyAreDue) {
  LossyPath path({}, milliseconds(30), 1);
  path.put({"a"}, kStart);
  path.put({"b"}, kStart + milliseconds(10));
  EXPECT_EQ(path.nextDue(), kStart + milliseconds(30));
  EXPECT_EQ(textOf(path.take(kStart + milliseconds(29))), "");
  EXPECT_EQ(textOf(path.take(kStart + milliseconds(30))), "a");
  EXPECT_EQ(textOf(path.take(kStart + milliseconds(100))), "b");
}

TEST(LossyPathTest, DoublesPackets) {
  LossyPath path({.duplicated = kAll}, milliseconds(0), 1);
  path.put({"a"}, kStart);
  path.put({"b"}, kStart);
  EXPECT_EQ(textOf(path.take(kStart)), "aabb");
}

TEST(LossyPathTest, LetsTheNextPacketOvertakeAReorderedOne) {
  // Seeds differ in which of the first packets are reordered; one is found where just the first is.
  const LossModel::Shares shares{.reordered = Share::ofPercentage("50").value()};
  for (std::uint64_t seed = 0; seed < 100; ++seed) {
    LossModel preview(shares, seed);
    if (!preview.next().isReordered || preview.next().isReordered || preview.next().isReordered) continue;
    LossyPath path(shares, milliseconds(0), seed);
    path.put({"a"}, kStart);
    EXPECT_EQ(textOf(path.take(kStart + milliseconds(1))), "");
    path.put({"b"}, kStart + milliseconds(2));
    path.put({"c"}, kStart + milliseconds(2));
    EXPECT_EQ(textOf(path.take(kStart + milliseconds(2))), "bac");
    return;
  }
  FAIL() << "no such seed";
}

TEST(LossyPathTest, LetsAReorderedPacketGoWhenNobodyOvertakesIt) {
  LossyPath path({.reordered = kAll}, milliseconds(5), 1);
  path.put({"a"}, kStart);
  path.put({"b"}, kStart);
  const auto due = kStart + milliseconds(5) + kReorderPatience;
  EXPECT_EQ(path.nextDue(), due);
  EXPECT_EQ(textOf(path.take(due - milliseconds(1))), "");
  EXPECT_EQ(textOf(path.take(due)), "ab");
}

TEST(LossyPathTest, HoldsNoMoreThanItMay) {
  LossyPath path({}, milliseconds(10), 1);
  for (std::size_t i = 0; i < kMaximumHeldPackets; ++i) EXPECT_TRUE(path.put({"a"}, kStart));
  EXPECT_FALSE(path.put({"b"}, kStart));
  EXPECT_EQ(path.lost(), 1U);
  EXPECT_EQ(path.take(kStart + milliseconds(10)).size(), kMaximumHeldPackets);
}

}  // namespace tallyd::station
