// How a backend ends: asked to clean up, or dropped.

#include <fcntl.h>

#include <algorithm>

#include "DashboardFixture.h"

namespace tallyd {
namespace {

class DashboardCleanupTest : public DashboardFixture {
 protected:
  using IDs = std::vector<std::uint16_t>;

  bool everythingIsGone() { return openDescriptors() == descriptors && fake.queues.armedTimers() == 0; }

  const Lines kScheduled{{Level::Debug, "Tally: scheduled last resort clean-up in 9500 ms."}};
  const Lines kCleanedUp{{Level::Debug, "Tally: scheduled last resort clean-up in 9500 ms."},
                         {Level::Debug, "Tally: clean up at myPeriodicTask."}};
};

TEST_F(DashboardCleanupTest, ClosesAtOnceWhenNothingWaits) {
  for (const auto& entry : {profile(), reliableProfile()}) {
    const auto backend = made(entry);
    fake.queues.advance(Seconds(20));
    EXPECT_EQ(fake.queues.armedTimers(), 1U);
    EXPECT_EQ(openDescriptors().size(), descriptors.size() + 1);
    backend->cleanup();
    EXPECT_EQ(openDescriptors().size(), descriptors.size() + 1);
    fake.queues.run();
    EXPECT_TRUE(everythingIsGone());
  }
  EXPECT_EQ(fake.log.lines(), Lines{});
}

TEST_F(DashboardCleanupTest, SendsWhatWasGivenBefore) {
  const auto backend = made(profile());
  send(*backend, 1);
  backend->cleanup();
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), IDs{1});
  EXPECT_TRUE(everythingIsGone());
}

TEST_F(DashboardCleanupTest, GivesPendingDatagramsATickAndNineAndAHalfSeconds) {
  const auto backend = made(profile({{"reliable", 8000}}));
  send(*backend, 1);
  fake.queues.run();
  backend->cleanup();
  fake.queues.advance(Milliseconds(7999));
  EXPECT_EQ(fake.log.lines(), Lines{});
  fake.queues.advance(Milliseconds(1));
  EXPECT_EQ(fake.log.lines(), kScheduled);
  fake.queues.advance(Milliseconds(9499));
  EXPECT_FALSE(everythingIsGone());
  EXPECT_EQ(receivedEventIDs(), (IDs{1, 1}));
  fake.queues.advance(Milliseconds(1));
  EXPECT_TRUE(everythingIsGone());
  EXPECT_EQ(fake.log.lines(), kScheduled);
}

TEST_F(DashboardCleanupTest, ClosesOnTheTickThatFindsNothingLeft) {
  const auto backend = made(reliableProfile());
  send(*backend, 1);
  fake.queues.run();
  backend->cleanup();
  fake.queues.advance(19 * kPeriod);
  EXPECT_EQ(fake.log.lines(), kScheduled);
  EXPECT_FALSE(everythingIsGone());
  fake.queues.advance(kPeriod);
  EXPECT_EQ(fake.log.lines(), kCleanedUp);
  EXPECT_EQ(openDescriptors(), descriptors);
  // The last resort finds nothing to do.
  EXPECT_EQ(fake.queues.armedTimers(), 1U);
  const int reused = ::dup(STDERR_FILENO);
  fake.queues.advance(Seconds(20));
  EXPECT_NE(::fcntl(reused, F_GETFD), -1) << "closed twice";
  ::close(reused);
  EXPECT_EQ(fake.log.lines(), kCleanedUp);
}

TEST_F(DashboardCleanupTest, ClosesOnTheFirstTickWhenThatSendsTheRest) {
  const auto backend = made(profile());
  disconnect();
  send(*backend, 1);
  backend->cleanup();
  fake.queues.run();
  EXPECT_FALSE(everythingIsGone());
  connectAgain();
  fake.queues.advance(Seconds(8));
  EXPECT_EQ(receivedEventIDs(), IDs{1});
  EXPECT_EQ(fake.log.lines(), (Lines{{Level::Debug, "Tally: clean up at myPeriodicTask."}}));
  EXPECT_TRUE(everythingIsGone());
}

TEST_F(DashboardCleanupTest, LeavesDatagramsThatCantBeSentToTheLastResort) {
  const auto backend = made(profile());
  disconnect();
  send(*backend, 1);
  backend->cleanup();
  fake.queues.advance(Seconds(8));
  EXPECT_EQ(fake.log.lines(), kScheduled);
  fake.queues.advance(Seconds(8));
  EXPECT_FALSE(everythingIsGone());
  fake.queues.advance(Milliseconds(1500));
  EXPECT_TRUE(everythingIsGone());
}

TEST_F(DashboardCleanupTest, MayBeAskedForTwice) {
  for (const auto& entry : {profile(), reliableProfile()}) {
    const auto backend = made(entry);
    backend->cleanup();
    backend->cleanup();
    fake.queues.run();
    EXPECT_TRUE(everythingIsGone());
    backend->cleanup();
    fake.queues.run();
  }
}

TEST_F(DashboardCleanupTest, QueuesWhatComesAfterItAndSendsItNever) {
  for (const auto& entry : {profile(), reliableProfile()}) {
    const auto backend = made(entry);
    backend->cleanup();
    fake.queues.run();
    const int reused = ::dup(STDERR_FILENO);  // Takes the closed socket's number.
    for (std::uint16_t event = 0; event < 100; ++event) send(*backend, event);
    fake.queues.advance(Seconds(100));
    EXPECT_EQ(receivedEventIDs(), IDs{});
    backend->cleanup();
    fake.queues.advance(Seconds(100));
    EXPECT_NE(::fcntl(reused, F_GETFD), -1);
    ::close(reused);
  }
}

TEST_F(DashboardCleanupTest, HoldsTheSocketForABackendThatIsReleased) {
  auto backend = made(reliableProfile());
  send(*backend, 1);
  backend->cleanup();
  backend.reset();
  fake.queues.advance(19 * kPeriod);
  EXPECT_EQ(receivedEventIDs(), (IDs{1, 1, 1, 1, 1}));
  fake.queues.advance(kPeriod);
  EXPECT_EQ(fake.log.lines(), kCleanedUp);
  EXPECT_EQ(openDescriptors(), descriptors);
}

TEST_F(DashboardCleanupTest, ADropClosesAtOnceWhenNothingWaits) {
  for (const auto& entry : {profile(), reliableProfile()}) {
    auto backend = made(entry);
    send(*backend, 1);
    fake.queues.advance(Seconds(20));
    backend.reset();
    fake.queues.run();
    EXPECT_TRUE(everythingIsGone());
  }
}

TEST_F(DashboardCleanupTest, ADropLetsPendingDatagramsRunOut) {
  auto backend = made(reliableProfile());
  send(*backend, 1);
  fake.queues.advance(3 * kPeriod);
  send(*backend, 2);
  backend.reset();
  fake.queues.advance(19 * kPeriod);
  EXPECT_FALSE(everythingIsGone());
  const IDs all = receivedEventIDs();
  EXPECT_EQ(std::count(all.begin(), all.end(), 1), 5);
  EXPECT_EQ(std::count(all.begin(), all.end(), 2), 5);
  fake.queues.advance(kPeriod);
  EXPECT_TRUE(everythingIsGone());
  EXPECT_EQ(fake.log.lines(), Lines{});
}

TEST_F(DashboardCleanupTest, ADropGivesUpDatagramsThatCantBeSentAfter21Ticks) {
  auto backend = made(profile());
  disconnect();
  send(*backend, 1);
  backend.reset();
  fake.queues.advance(Seconds(8 * 20));
  EXPECT_FALSE(everythingIsGone());
  fake.queues.advance(Seconds(8));
  EXPECT_TRUE(everythingIsGone());
}

}  // namespace
}  // namespace tallyd
