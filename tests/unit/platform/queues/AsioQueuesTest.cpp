#include "platform/queues/AsioQueues.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <new>
#include <stdexcept>
#include <thread>
#include <vector>

#include "Gate.h"
#include "fakes/FakeLog.h"
#include "platform/queues/GrowingPool.h"

namespace tallyd::platform {
namespace {

TEST(AsioQueuesTest, RunsWorkInTheOrderInWhichItWasGiven) {
  AsioQueues queues(4);
  const auto queue = queues.makeSerialQueue("test");
  std::vector<int> order;
  Gate done;
  for (int i = 0; i < 1'000; ++i) queue->async([&order, i] { order.push_back(i); });
  queue->async([&] { done.pass(); });
  ASSERT_TRUE(done.waitFor(1));
  ASSERT_EQ(order.size(), 1'000U);
  for (int i = 0; i < 1'000; ++i) EXPECT_EQ(order[static_cast<std::size_t>(i)], i);
}

TEST(AsioQueuesTest, RunsOnePieceOfAQueuesWorkAtATime) {
  AsioQueues queues(4);
  const auto queue = queues.makeSerialQueue("test");
  std::atomic<int> running{0};
  std::atomic<bool> overlapped{false};
  Gate done;
  std::vector<std::thread> givers;
  for (int t = 0; t < 4; ++t) {
    givers.emplace_back([&] {
      for (int i = 0; i < 500; ++i) {
        queue->async([&] {
          if (running.fetch_add(1) != 0) overlapped = true;
          running.fetch_sub(1);
          done.pass();
        });
      }
    });
  }
  for (auto& giver : givers) giver.join();
  ASSERT_TRUE(done.waitFor(2'000));
  EXPECT_FALSE(overlapped);
}

TEST(AsioQueuesTest, QueuesWorkThatIsGivenFromTheQueueItself) {
  AsioQueues queues(1);
  const auto queue = queues.makeSerialQueue("test");
  std::vector<int> order;
  Gate done;
  queue->async([&] {
    queue->async([&] {
      order.push_back(2);
      done.pass();
    });
    order.push_back(1);
  });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_EQ(order, (std::vector<int>{1, 2}));
}

TEST(AsioQueuesTest, DispatchesAtOnceToAnIdleQueue) {
  AsioQueues queues(2);
  const auto caller = queues.makeSerialQueue("caller");
  const auto idle = queues.makeSerialQueue("idle");
  std::vector<int> order;
  Gate done;
  caller->async([&] {
    order.push_back(1);
    idle->dispatch([&] { order.push_back(2); });
    order.push_back(3);
    done.pass();
  });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_EQ(order, (std::vector{1, 2, 3}));
}

TEST(AsioQueuesTest, DispatchesBehindWhatIsQueued) {
  AsioQueues queues(2);
  const auto caller = queues.makeSerialQueue("caller");
  const auto busy = queues.makeSerialQueue("busy");
  std::vector<int> order;
  Gate started;
  Gate dispatched;
  Gate done;
  busy->async([&] {
    started.pass();
    EXPECT_TRUE(dispatched.waitFor(1));
    order.push_back(1);
  });
  busy->async([&] { order.push_back(2); });
  ASSERT_TRUE(started.waitFor(1));
  caller->async([&] {
    busy->dispatch([&] {
      order.push_back(3);
      done.pass();
    });
    dispatched.pass();
  });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_EQ(order, (std::vector{1, 2, 3}));
}

TEST(AsioQueuesTest, DispatchesFromOutsideThePoolAsItQueues) {
  AsioQueues queues(1);
  const auto queue = queues.makeSerialQueue("test");
  std::thread::id thread;
  Gate done;
  queue->dispatch([&] {
    thread = std::this_thread::get_id();
    done.pass();
  });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_NE(thread, std::this_thread::get_id());
}

TEST(AsioQueuesTest, KeepsTheLabelOfAQueue) {
  AsioQueues queues(1);
  EXPECT_EQ(queues.makeSerialQueue("com.quillon.test")->label(), "com.quillon.test");
}

TEST(AsioQueuesTest, StartsItsThreadsWithTheFirstQueue) {
  AsioQueues queues(3);
  EXPECT_EQ(queues.threadCount(), 0U);
  const auto queue = queues.makeSerialQueue("test");
  EXPECT_EQ(queues.threadCount(), 3U);
}

TEST(AsioQueuesTest, HasAtLeastTwoThreadsByDefault) { EXPECT_GE(AsioQueues::defaultThreadCount(), 2U); }

TEST(AsioQueuesTest, DelayedWorkComesAfterItsDelay) {
  AsioQueues queues(2);
  const auto queue = queues.makeSerialQueue("test");
  const auto begin = std::chrono::steady_clock::now();
  Gate done;
  queue->asyncAfter(std::chrono::milliseconds(30), [&] { done.pass(); });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(30));
}

TEST(AsioQueuesTest, AQueueLivesAsLongAsItsWork) {
  AsioQueues queues(1);
  Gate done;
  queues.makeSerialQueue("test")->asyncAfter(std::chrono::milliseconds(5), [&] { done.pass(); });
  EXPECT_TRUE(done.waitFor(1));
}

TEST(AsioQueuesTest, DropsWorkThatHasNotStartedAtTheEnd) {
  const auto held = std::make_shared<int>(1);
  {
    AsioQueues queues(1);
    const auto queue = queues.makeSerialQueue("test");
    queue->asyncAfter(std::chrono::hours(1), [held] {});
    EXPECT_EQ(held.use_count(), 2);
  }
  EXPECT_EQ(held.use_count(), 1);
}

void throwOften(SerialQueue& queue) {
  queue.async([] { throw std::runtime_error("a reason"); });
  queue.async([] { throw std::bad_alloc(); });
  queue.async([] { throw 7; });
  queue.asyncAfter(std::chrono::milliseconds(1), [] { throw std::runtime_error("later"); });
}

TEST(AsioQueuesTest, GivesUpWorkThatThrowsAndGoesOnWhereThatIsLogged) {
  fakes::FakeLog log;
  AsioQueues queues(1, &log);
  const auto queue = queues.makeSerialQueue("com.quillon.test");
  Gate done;
  throwOften(*queue);
  queue->async([&] { done.pass(); });
  ASSERT_TRUE(done.waitFor(1));
  queue->asyncAfter(std::chrono::milliseconds(2), [&] { done.pass(); });
  ASSERT_TRUE(done.waitFor(2));
  const auto critical = [](std::string text) {
    return fakes::FakeLog::Line{LogLevel::Critical, std::move(text)};
  };
  EXPECT_EQ(log.lines(), (std::vector{critical("Gave up work on queue com.quillon.test: a reason"),
                                      critical(std::string("Gave up work on queue com.quillon.test: ") +
                                               std::bad_alloc().what()),
                                      critical("Gave up work on queue com.quillon.test"),
                                      critical("Gave up work on queue com.quillon.test: later")}));
}

TEST(AsioQueuesDeathTest, EndsTheProcessForWorkThatThrowsWithoutALog) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(
      {
        AsioQueues queues(1);
        const auto queue = queues.makeSerialQueue("test");
        Gate never;
        queue->async([] { throw std::runtime_error("a reason"); });
        EXPECT_TRUE(never.waitFor(1));
      },
      "a reason");
}

class BlockedQueuesTest : public testing::TestWithParam<std::size_t> {
 protected:
  static constexpr int kBlocked = 40;

  /// So many queues with work that blocks until it is released.
  struct BlockedCalls {
    explicit BlockedCalls(AsioQueues& queues) {
      for (int i = 0; i < kBlocked; ++i) {
        queues.makeSerialQueue("blocked")->async([this, &queues] {
          {
            const auto call = queues.blockingCall();
            blocked.pass();
            EXPECT_TRUE(release.waitFor(1));
          }
          ended.pass();
        });
      }
    }

    Gate blocked;
    Gate release;
    Gate ended;
  };
};

TEST_P(BlockedQueuesTest, AnyNumberOfBlockedCallsDelaysNoOtherQueue) {
  AsioQueues queues(GetParam());
  BlockedCalls calls(queues);
  ASSERT_TRUE(calls.blocked.waitFor(kBlocked));
  Gate other;
  queues.makeSerialQueue("other")->async([&] { other.pass(); });
  EXPECT_TRUE(other.waitFor(1));
  EXPECT_EQ(queues.threadCount(), GetParam() + kBlocked);
  calls.release.pass();
  ASSERT_TRUE(calls.ended.waitFor(kBlocked));
}

TEST_P(BlockedQueuesTest, SurplusThreadsLeaveAndAFewAreKeptForTheNextCalls) {
  AsioQueues queues(GetParam());
  for (int round = 0; round < 3; ++round) {
    BlockedCalls calls(queues);
    ASSERT_TRUE(calls.blocked.waitFor(kBlocked));
    EXPECT_LE(queues.threadCount(), GetParam() + kBlocked);
    calls.release.pass();
    ASSERT_TRUE(calls.ended.waitFor(kBlocked));
    const auto deadline = std::chrono::steady_clock::now() + Gate::kDeadline;
    while (queues.threadCount() > GetParam() + GrowingPool::kMaximumParked) {
      ASSERT_LT(std::chrono::steady_clock::now(), deadline);
      std::this_thread::yield();
    }
  }
}

INSTANTIATE_TEST_SUITE_P(PoolSizes, BlockedQueuesTest, testing::Values(1U, 2U));

TEST(AsioQueuesTest, ABlockingCallOutsideThePoolNeedsNoStandIn) {
  AsioQueues queues(1);
  const auto queue = queues.makeSerialQueue("test");
  const auto call = queues.blockingCall();
  EXPECT_EQ(queues.threadCount(), 1U);
}

}  // namespace
}  // namespace tallyd::platform
