#include "HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

class BatchingTest : public HTTPSPostBackendFixture {
 protected:
  /// A backend that is on and holds events back because the client asked for it.
  std::shared_ptr<HTTPSPostBackend> batching(const Array& clients = {defaultEntry()}) {
    auto backend = evaluated(clients);
    backend->setBatchEvents(true);
    fake.log.clear();
    return backend;
  }
  static void send(HTTPSPostBackend& backend, std::uint16_t method, int count = 1) {
    for (int i = 0; i < count; ++i) {
      EXPECT_EQ(backend.sendMessage(Dictionary{{"i", i}}, kEventTime, method, 4), std::nullopt);
    }
  }
  [[nodiscard]] std::size_t dropped(int method) const {
    return fake.log.count(Level::Debug,
                          "HTTPSPostBackend: Dropping batched event (" + std::to_string(method) + ")");
  }
};

// What is held back

TEST_F(BatchingTest, HoldsEveryEventBackWhileThatItMayReportIsNotKnown) {
  const auto backend = pending();
  send(*backend, 3, 2);
  EXPECT_EQ(backend->batchedEventCount(), 2U);
  backend->setRequireUserInfo(false);
  send(*backend, 3);
  EXPECT_EQ(backend->batchedEventCount(), 3U);
  EXPECT_EQ(postCount(), 0U);
}

TEST_F(BatchingTest, HoldsEventsBackWhileRequiredUserInfoIsMissing) {
  const auto backend = evaluated();
  backend->setUserInfoDict(std::nullopt);
  send(*backend, 3);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
  EXPECT_EQ(postCount(), 0U);
}

TEST_F(BatchingTest, HoldsEventsBackUntilTheFlushWhenTheClientAskedForIt) {
  const auto backend = batching();
  send(*backend, 3, 2);
  EXPECT_EQ(postCount(), 0U);
  const auto posted = backend->flushMessages();
  EXPECT_EQ(postCount(), 1U);
  ASSERT_EQ(lastEvents().size(), 2U);
  EXPECT_EQ(lastEvents()[0].integer("i"), 0);
  EXPECT_EQ(lastEvents()[1].integer("i"), 1);
  EXPECT_EQ(posted, textOf(lastPost()));
  EXPECT_EQ(backend->batchedEventCount(), 0U);
}

TEST_F(BatchingTest, DropsTheFiftyFirstEventOfOneMethodAndStartsAgainAfterAFlush) {
  const auto backend = batching();
  send(*backend, 3, 51);
  EXPECT_EQ(backend->batchedEventCount(), 50U);
  EXPECT_EQ(dropped(3), 1U);
  send(*backend, 4, 50);
  EXPECT_EQ(backend->batchedEventCount(), 100U);
  EXPECT_EQ(dropped(4), 0U);

  backend->flushMessages();
  EXPECT_EQ(lastEvents().size(), 100U);
  send(*backend, 3, 51);
  EXPECT_EQ(backend->batchedEventCount(), 50U);
  EXPECT_EQ(dropped(3), 2U);
}

TEST_F(BatchingTest, TakesItsLimitFromTheStorebag) {
  const auto backend = batching({entryWith("event_threshold", 2)});
  send(*backend, 3, 5);
  EXPECT_EQ(backend->batchedEventCount(), 3U);
  EXPECT_EQ(dropped(3), 2U);
}

TEST_F(BatchingTest, HoldsOneEventOfAMethodWithALimitOfZeroAndNoneBelow) {
  const auto zero = batching({entryWith("event_threshold", 0)});
  send(*zero, 3, 3);
  EXPECT_EQ(zero->batchedEventCount(), 1U);
  const auto negative = batching({entryWith("event_threshold", -1)});
  send(*negative, 3, 3);
  EXPECT_EQ(negative->batchedEventCount(), 0U);
  EXPECT_EQ(dropped(3), 3U);
}

TEST_F(BatchingTest, AttachesUserInfoWhenAnEventLeaves) {
  const auto backend = pending();
  send(*backend, 3);
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(lastEvent().string(kTallyUserInfoClientName), "Alpha");
  EXPECT_EQ(lastEvent().string(kTallyUserInfoServiceName), "VideoCallService");
}

// The flush that is asked for

TEST_F(BatchingTest, FlushesNothingWithoutABatch) {
  EXPECT_EQ(batching()->flushMessages(), std::nullopt);
  EXPECT_EQ(postCount(), 0U);
}

TEST_F(BatchingTest, FlushesNothingUnlessTheClientAskedForBatching) {
  const auto backend = batching();
  send(*backend, 3);
  backend->setBatchEvents(false);
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
  EXPECT_EQ(postCount(), 0U);
}

TEST_F(BatchingTest, FlushesNothingUnlessItIsOn) {
  const auto backend = batching();
  send(*backend, 3);
  for (const auto state : {ReportingStatePending, ReportingStateOff}) {
    backend->setState(state);
    EXPECT_EQ(backend->flushMessages(), std::nullopt);
    EXPECT_EQ(backend->batchedEventCount(), 1U);
  }
  EXPECT_EQ(postCount(), 0U);
  backend->setState(ReportingStateOn);
  EXPECT_NE(backend->flushMessages(), std::nullopt);
}

TEST_F(BatchingTest, FlushesNothingWhileRequiredUserInfoIsMissing) {
  const auto backend = batching();
  send(*backend, 3);
  backend->setUserInfoDict(std::nullopt);
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
  backend->setRequireUserInfo(false);
  EXPECT_NE(backend->flushMessages(), std::nullopt);
  EXPECT_EQ(postCount(), 1U);
}

TEST_F(BatchingTest, PostsABatchInWhichEveryEventWasDropped) {
  const auto backend = batching({entryWith("event_threshold", -1)});
  send(*backend, 3);
  EXPECT_NE(backend->flushMessages(), std::nullopt);
  EXPECT_EQ(postCount(), 1U);
  EXPECT_TRUE(lastEvents().empty());
}

// The flush on a change of state

TEST_F(BatchingTest, PostsTheBatchOnceTheStateIsOn) {
  const auto backend = pending();
  send(*backend, 3, 2);
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(lastEvents().size(), 2U);
  EXPECT_EQ(backend->batchedEventCount(), 0U);
  backend->updateState();
  EXPECT_EQ(postCount(), 1U);
}

TEST_F(BatchingTest, KeepsTheBatchOnAChangeOfStateWhenTheClientAskedForBatching) {
  const auto backend = pending();
  backend->setBatchEvents(true);
  send(*backend, 3);
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
}

TEST_F(BatchingTest, KeepsTheBatchWhileOffForALaterFlush) {
  const auto backend = pending();
  send(*backend, 3);
  fake.locale.country = "FR";
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(backend->state(), ReportingStateOff);
  send(*backend, 3);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
  EXPECT_EQ(postCount(), 0U);
  fake.locale.country = "DE";
  backend->updateState();
  EXPECT_EQ(lastEvents().size(), 1U);
}

TEST_F(BatchingTest, DoesNotStartCountingAgainAfterTheFlushOnAChangeOfState) {
  const auto backend = pending();
  send(*backend, 3, 50);
  send(*backend, 4, 49);
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(lastEvents().size(), 99U);

  backend->setUserInfoDict(std::nullopt);
  send(*backend, 3);
  send(*backend, 4, 2);
  EXPECT_EQ(dropped(3), 1U);
  EXPECT_EQ(dropped(4), 1U);
  EXPECT_EQ(backend->batchedEventCount(), 1U);
}

// The correlated session

TEST_F(BatchingTest, RenamesTheSessionOfEventsHeldBackOnceItIsCorrelated) {
  const auto backend = batching();
  send(*backend, 3, 2);
  backend->setCorrelatedSessionID("parent.child");
  EXPECT_EQ(backend->combinedSessionIDString(), "parent.child");
  send(*backend, 4);
  backend->flushMessages();
  ASSERT_EQ(lastEvents().size(), 3U);
  for (const Dictionary& event : lastEvents()) EXPECT_EQ(event.string("_sessionID"), "parent.child");
}

TEST_F(BatchingTest, TakesACorrelatedSessionWithoutABatch) {
  const auto backend = batching();
  backend->setCorrelatedSessionID("parent.child");
  EXPECT_EQ(backend->combinedSessionIDString(), "parent.child");
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
}

// The end of the backend

TEST_F(BatchingTest, PostsTheBatchAtItsEndAndLogsWhatItPosted) {
  auto backend = batching();
  send(*backend, 3);
  fake.log.clear();
  backend.reset();
  ASSERT_EQ(postCount(), 1U);
  EXPECT_EQ(lastEvents().size(), 1U);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "dealloc: flush batched events, " + textOf(lastPost())}}));
}

TEST_F(BatchingTest, LogsNoDocumentAtItsEndWhenTheUserMayNotSeeIt) {
  auto backend = batching({entryWith("override_dnu", 1)});
  send(*backend, 3);
  fake.log.clear();
  backend.reset();
  EXPECT_EQ(postCount(), 1U);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "dealloc: flush batched events, (null)"}}));
}

TEST_F(BatchingTest, PostsTheBatchAtItsEndAlsoWithoutRequiredUserInfo) {
  auto backend = batching();
  send(*backend, 3);
  backend->setUserInfoDict(std::nullopt);
  backend.reset();
  EXPECT_EQ(lastEvents().size(), 1U);
}

TEST_F(BatchingTest, LosesTheBatchAtItsEndWhenItIsNotOnOrNobodyAskedForBatching) {
  auto off = batching();
  send(*off, 3);
  off->setState(ReportingStateOff);
  auto waiting = batching();
  send(*waiting, 3);
  waiting->setState(ReportingStatePending);
  auto unasked = batching();
  send(*unasked, 3);
  unasked->setBatchEvents(false);
  auto flushed = batching();
  fake.log.clear();
  off.reset();
  waiting.reset();
  unasked.reset();
  flushed.reset();
  EXPECT_EQ(postCount(), 0U);
  EXPECT_TRUE(lines().empty());
}

}  // namespace
}  // namespace tallyd
