#include "backends/power-log/WattbookBackend.h"

#include <gtest/gtest.h>

#include "fakes/FakePlatform.h"

namespace tallyd {
namespace {

using fakes::FakePowerLog;
using platform::Dictionary;
using Events = std::vector<FakePowerLog::Event>;

class WattbookBackendTest : public testing::Test {
 protected:
  TallyBackend::Result send(const TallyBackend::Payload& payload, std::uint16_t method,
                            std::uint16_t respCode = 0) {
    return backend->sendMessage(payload, kTime, method, respCode);
  }

  static constexpr timeval kTime{1'768'478'460, 750'000};
  fakes::FakePlatform fake;
  std::shared_ptr<WattbookBackend> backend =
      WattbookBackend::initWithName(fake.platform, "power", Dictionary(), "Kasten");
};

TEST_F(WattbookBackendTest, RecordsThePayloadWithMethodResponseCodeAndEvent) {
  EXPECT_EQ(send(Dictionary{{"level", 80}}, 3, 500), std::nullopt);
  EXPECT_EQ(
      fake.powerLog.events(),
      (Events{{28, "StagehostD-RTC", {{"level", 80}, {"method", 3}, {"respCode", 500}, {"event", 1}}}}));
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(WattbookBackendTest, NumbersItsEventsAlsoThoseThatItPassesBy) {
  send(Dictionary{{"a", 1}}, 1);
  send(Dictionary{{"a", 1}}, 0);
  send(Dictionary{{"a", 1}}, 1);
  const auto events = fake.powerLog.events();
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(events[0].record.integer("event"), 1);
  EXPECT_EQ(events[1].record.integer("event"), 3);
}

TEST_F(WattbookBackendTest, PassesByEveryMessageWithMethodZero) {
  EXPECT_EQ(send(Dictionary{{"a", 1}}, 0, 7), std::nullopt);
  EXPECT_EQ(send(Dictionary{{"method", 5}}, 0), std::nullopt);
  EXPECT_TRUE(fake.powerLog.events().empty());
}

TEST_F(WattbookBackendTest, PassesByMessagesWithoutPayload) {
  EXPECT_EQ(send(Dictionary(), 5), std::nullopt);
  EXPECT_EQ(send(std::nullopt, 5), std::nullopt);
  EXPECT_TRUE(fake.powerLog.events().empty());
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(WattbookBackendTest, ReplacesEntriesOfThePayloadAndLeavesThePayloadAlone) {
  const Dictionary payload{{"event", "theirs"}, {"method", "theirs"}, {"respCode", "theirs"}, {"a", 1}};
  send(payload, 65'535, 65'535);
  ASSERT_EQ(fake.powerLog.events().size(), 1U);
  EXPECT_EQ(fake.powerLog.events()[0].record,
            (Dictionary{{"event", 1}, {"method", 65'535}, {"respCode", 65'535}, {"a", 1}}));
  EXPECT_EQ(payload.string("event"), "theirs");
}

TEST_F(WattbookBackendTest, NeedsNoProfileAndReportsAlways) {
  const auto bare = WattbookBackend::initWithName(fake.platform, "power", std::nullopt, std::nullopt);
  ASSERT_NE(bare, nullptr);
  EXPECT_EQ(bare->state(), ReportingStatePending);
  bare->updateState();
  EXPECT_EQ(bare->state(), ReportingStateOn);
  EXPECT_EQ(bare->flushMessages(), std::nullopt);
}

TEST_F(WattbookBackendTest, BooksWhatItRecordsAndWhatItDoesNot) {
  send(Dictionary{{"a", 1}}, 1);
  send(Dictionary{{"a", 1}}, 0);
  send(std::nullopt, 0);
  send(std::nullopt, 1);
  send(Dictionary(), 1);
  const auto counts = backend->account().counts();
  EXPECT_EQ(counts.accepted, 5U);
  EXPECT_EQ(counts.sent, fake.powerLog.events().size());
  EXPECT_EQ(*counts.dictionary().dictionary("dropped"), (Dictionary{{"no-method", 2}, {"no-payload", 2}}));
  EXPECT_TRUE(counts.isBalanced());
}

TEST_F(WattbookBackendTest, BooksAsDroppedWhatThePowerLogHasNotRecorded) {
  send(Dictionary{{"a", 1}}, 1);
  fake.powerLog.setFull(true);
  EXPECT_EQ(send(Dictionary{{"a", 2}}, 1), std::nullopt);
  EXPECT_EQ(send(Dictionary{{"a", 3}}, 1), std::nullopt);
  fake.powerLog.setFull(false);
  send(Dictionary{{"a", 4}}, 1);
  const auto counts = backend->account().counts();
  EXPECT_EQ(counts.accepted, 4U);
  EXPECT_EQ(counts.sent, 2U);
  EXPECT_EQ(*counts.dictionary().dictionary("dropped"), (Dictionary{{"not-recorded", 2}}));
  EXPECT_TRUE(counts.isBalanced());
  EXPECT_EQ(fake.powerLog.events().size(), 2U);
  EXPECT_TRUE(fake.log.lines().empty());
}

}  // namespace
}  // namespace tallyd
