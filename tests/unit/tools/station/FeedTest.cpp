#include "station/Feed.h"

#include <gtest/gtest.h>

#include <future>

namespace tallyd::station {

using Kind = Feed::Kind;
using std::chrono::milliseconds;

namespace {

constexpr milliseconds kForever = std::chrono::minutes(1);

std::string textOf(const std::vector<Feed::Entry>& entries) {
  std::string text;
  for (const auto& entry : entries) text += std::to_string(entry.number) + *entry.record + " ";
  return text;
}

}  // namespace

TEST(FeedTest, NumbersRecordsAcrossKinds) {
  Feed feed(10);
  feed.publish(Kind::Event, "a");
  feed.publish(Kind::Datagram, "b");
  feed.publish(Kind::Event, "c");
  EXPECT_EQ(textOf(feed.since(0)), "1a 2b 3c ");
  EXPECT_EQ(textOf(feed.since(1)), "2b 3c ");
  EXPECT_EQ(textOf(feed.since(3)), "");
  EXPECT_EQ(feed.since(1)[0].kind, Kind::Datagram);
}

TEST(FeedTest, KeepsTheLatestOfEachKind) {
  Feed feed(2);
  feed.publish(Kind::Upload, "a");
  for (const char* record : {"b", "c", "d"}) feed.publish(Kind::Event, record);
  EXPECT_EQ(textOf(feed.since(0)), "1a 3c 4d ");
}

TEST(FeedTest, WaitsUntilThereIsMore) {
  Feed feed(10);
  EXPECT_FALSE(feed.waitForMore(0, milliseconds(0)));
  auto waiting = std::async(std::launch::async, [&] { return feed.waitForMore(0, kForever); });
  feed.publish(Kind::LogData, "a");
  EXPECT_TRUE(waiting.get());
  EXPECT_TRUE(feed.waitForMore(0, milliseconds(0)));
  EXPECT_FALSE(feed.waitForMore(1, milliseconds(0)));
}

TEST(FeedTest, HoldsNobodyUpOnceItIsClosed) {
  Feed feed(10);
  auto waiting = std::async(std::launch::async, [&] { return feed.waitForMore(0, kForever); });
  feed.close();
  EXPECT_FALSE(waiting.get());
  EXPECT_FALSE(feed.waitForMore(0, kForever));
  feed.publish(Kind::Event, "a");
  EXPECT_TRUE(feed.waitForMore(0, kForever));
}

}  // namespace tallyd::station
