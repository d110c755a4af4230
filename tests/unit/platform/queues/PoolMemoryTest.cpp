// Memory that runs out while a thread is to be started.

#include <gtest/gtest.h>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <memory>
#include <new>
#include <thread>

#include "Gate.h"
#include "platform/queues/AsioQueues.h"
#include "platform/queues/GrowingPool.h"
#include "support/FailingAllocation.h"

namespace tallyd::platform {
namespace {

using test::OneFailingAllocation;

/// Begins a blocking call for each allocation that its stand-in takes, which then fails. On a thread of the
/// pool; returns how many stand-ins there were no memory for.
int callsWithoutStandIn(AsioQueues& queues) {
  for (int number = 2;; ++number) {  // The first allocation is the call's own.
    const OneFailingAllocation failing(std::this_thread::get_id(), number);
    std::unique_ptr<Queues::BlockingCall> call;
    EXPECT_NO_THROW(call = queues.blockingCall());
    if (!failing.hasFailed()) return number - 2;
    EXPECT_EQ(queues.threadCount(), 1U);
  }
}

TEST(PoolMemoryTest, ABlockingCallGoesOnWithoutAStandInForWhichThereIsNoMemory) {
  AsioQueues queues(1);
  Gate done;
  queues.makeSerialQueue("test")->async([&] {
    EXPECT_GT(callsWithoutStandIn(queues), 0);
    done.pass();
  });
  ASSERT_TRUE(done.waitFor(1));
  // The one stand-in of the call that had memory serves all further ones, if the pool still knows how many
  // threads it runs.
  for (int call = 0; call < 3; ++call) {
    queues.makeSerialQueue("test")->async([&] {
      {
        const auto blocking = queues.blockingCall();
        EXPECT_EQ(queues.threadCount(), 2U);
      }
      done.pass();
    });
    ASSERT_TRUE(done.waitFor(2 + call));
  }
}

TEST(PoolMemoryTest, StartsTheThreadsForWhichThereWasNoMemoryTheNextTime) {
  constexpr std::size_t kThreads = 3;
  for (int number = 1;; ++number) {
    asio::io_context loop;
    const auto work = asio::make_work_guard(loop);
    GrowingPool pool(loop, kThreads);
    bool failed = true;
    try {
      const OneFailingAllocation failing(std::this_thread::get_id(), number);
      pool.start();
      failed = failing.hasFailed();
    } catch (const std::bad_alloc&) {
    }
    pool.start();
    EXPECT_EQ(pool.threadCount(), kThreads) << "allocation " << number;
    if (!failed) {
      EXPECT_GT(number, 1);
      return;
    }
  }
}

}  // namespace
}  // namespace tallyd::platform
