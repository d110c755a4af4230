#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <memory>
#include <stdexcept>
#include <vector>

#include "Gate.h"
#include "fakes/FakeLog.h"
#include "platform/FileDescriptor.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd::platform {
namespace {

using namespace std::chrono_literals;

class AsioSourcesTest : public testing::Test {
 protected:
  AsioSourcesTest() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()), 0);
    _here = FileDescriptor(ends[0]);
    _there = FileDescriptor(ends[1]);
  }

  void sendByte() const { EXPECT_EQ(::write(_there.get(), "x", 1), 1); }
  bool takeByte() const {
    char byte = 0;
    return ::read(_here.get(), &byte, 1) == 1;
  }
  void fillOutput() const {
    const std::array<char, 4096> bytes{};
    while (::write(_here.get(), bytes.data(), bytes.size()) > 0) {
    }
  }
  void drainOtherEnd() const {
    std::array<char, 4096> bytes{};
    while (::read(_there.get(), bytes.data(), bytes.size()) > 0) {
    }
  }
  /// Everything that was queued before has run.
  void flush() {
    Gate done;
    _queue->async([&] { done.pass(); });
    ASSERT_TRUE(done.waitFor(1));
  }

  /// Cancels, and waits for the handler that may be under way: it uses the test's own variables.
  void stop(std::unique_ptr<Source>& source) {
    source.reset();
    flush();
  }

  AsioQueues _queues{2};
  std::shared_ptr<SerialQueue> _queue = _queues.makeSerialQueue("test");
  FileDescriptor _here;
  FileDescriptor _there;
};

TEST_F(AsioSourcesTest, ATimerTicksUntilItIsCancelled) {
  Gate ticks;
  Gate cancelled;
  const auto timer = _queue->makeTimer(
      1ms, 1ms, [&] { ticks.pass(); }, [&] { cancelled.pass(); });
  ASSERT_TRUE(ticks.waitFor(5));
  _queue->async([&] { timer->cancel(); });
  ASSERT_TRUE(cancelled.waitFor(1));
  const int before = ticks.passed();
  Gate later;
  _queue->asyncAfter(20ms, [&] { later.pass(); });
  ASSERT_TRUE(later.waitFor(1));
  EXPECT_EQ(ticks.passed(), before);
  EXPECT_EQ(cancelled.passed(), 1);
}

TEST_F(AsioSourcesTest, ATimerDoesNotMakeUpForLateTicks) {
  Gate ticks;
  Gate blocked;
  Gate release;
  const auto begin = std::chrono::steady_clock::now();
  auto timer = _queue->makeTimer(1ms, 50ms, [&] {
    if (ticks.passed() == 0) {
      blocked.pass();
      EXPECT_TRUE(release.waitFor(1));
    }
    ticks.pass();
  });
  ASSERT_TRUE(blocked.waitFor(1));
  Gate later;
  _queues.makeSerialQueue("other")->asyncAfter(230ms, [&] { later.pass(); });
  ASSERT_TRUE(later.waitFor(1));
  release.pass();
  ASSERT_TRUE(ticks.waitFor(3));
  // One late tick, then two at the next places of the 50 ms grid; made up for, four would come at once.
  EXPECT_GE(std::chrono::steady_clock::now() - begin, 300ms);
  stop(timer);
}

TEST_F(AsioSourcesTest, AReadSourceCallsAsLongAsThereIsSomethingToRead) {
  Gate calls;
  auto source = _queue->makeReadSource(_here.get(), [&] {
    EXPECT_TRUE(takeByte());
    calls.pass();
  });
  sendByte();
  sendByte();
  sendByte();
  EXPECT_TRUE(calls.waitFor(3));
  sendByte();
  EXPECT_TRUE(calls.waitFor(4));
  stop(source);
}

TEST_F(AsioSourcesTest, AReadSourceCallsWhenTheOtherEndHasClosed) {
  Gate calls;
  auto source = _queue->makeReadSource(_here.get(), [&] { calls.pass(); });
  _there.reset();
  EXPECT_TRUE(calls.waitFor(2));
  stop(source);
}

TEST_F(AsioSourcesTest, ReadAndWriteSourcesShareADescriptor) {
  Gate reads;
  Gate writes;
  fillOutput();
  auto reading = _queue->makeReadSource(_here.get(), [&] {
    takeByte();
    reads.pass();
  });
  auto writing = _queue->makeWriteSource(_here.get(), [&] { writes.pass(); });
  sendByte();
  ASSERT_TRUE(reads.waitFor(1));
  EXPECT_EQ(writes.passed(), 0);
  drainOtherEnd();
  ASSERT_TRUE(writes.waitFor(1));
  stop(writing);
  sendByte();
  EXPECT_TRUE(reads.waitFor(2));
  stop(reading);
}

TEST_F(AsioSourcesTest, AHandlerThatThrowsIsCalledAgain) {
  fakes::FakeLog log;
  AsioQueues queues(1, &log);
  const auto queue = queues.makeSerialQueue("com.quillon.test");
  Gate ticks;
  auto timer = queue->makeTimer(1ms, 1ms, [&] {
    ticks.pass();
    throw std::runtime_error("a tick");
  });
  EXPECT_TRUE(ticks.waitFor(3));
  timer.reset();
  Gate reads;
  auto source = queue->makeReadSource(_here.get(), [&] {
    takeByte();
    reads.pass();
    throw std::runtime_error("a byte");
  });
  for (int bytes = 1; bytes <= 3; ++bytes) {
    sendByte();
    EXPECT_TRUE(reads.waitFor(bytes));
  }
  source.reset();
  Gate done;
  queue->async([&] { done.pass(); });
  ASSERT_TRUE(done.waitFor(1));
  EXPECT_GE(log.count(LogLevel::Critical, "Gave up work on queue com.quillon.test: a tick"), 3U);
  EXPECT_EQ(log.count(LogLevel::Critical, "Gave up work on queue com.quillon.test: a byte"), 3U);
}

TEST_F(AsioSourcesTest, NoHandlerStartsAfterTheQueueItselfCancelled) {
  Gate cancelled;
  std::atomic<bool> over{false};
  std::unique_ptr<Source> source;
  _queue->async([&] {
    source = _queue->makeReadSource(
        _here.get(), [&] { EXPECT_FALSE(over); }, [&] { cancelled.pass(); });
  });
  sendByte();
  flush();
  _queue->async([&] {
    source->cancel();
    over = true;
  });
  ASSERT_TRUE(cancelled.waitFor(1));
  source->cancel();
  flush();
  EXPECT_EQ(cancelled.passed(), 1);
}

TEST_F(AsioSourcesTest, AHandlerMayCancelItsOwnSource) {
  Gate cancelled;
  int calls = 0;
  std::unique_ptr<Source> source;
  _queue->async([&] {
    source = _queue->makeReadSource(
        _here.get(),
        [&] {
          ++calls;
          source.reset();
        },
        [&] { cancelled.pass(); });
  });
  sendByte();
  ASSERT_TRUE(cancelled.waitFor(1));
  flush();
  EXPECT_EQ(calls, 1);
}

TEST_F(AsioSourcesTest, TheDescriptorMayBeClosedAndItsNumberUsedAgainAfterCancelling) {
  for (int round = 0; round < 200; ++round) {
    std::array<int, 2> ends{};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()), 0);
    const FileDescriptor here(ends[0]);
    const FileDescriptor there(ends[1]);
    Gate calls;
    auto source = _queue->makeReadSource(here.get(), [&] { calls.pass(); });
    ASSERT_EQ(::write(there.get(), "x", 1), 1);
    ASSERT_TRUE(calls.waitFor(1));
    stop(source);
    EXPECT_NE(::fcntl(here.get(), F_GETFD), -1);
  }
}

TEST_F(AsioSourcesTest, DestroyingTheQueuesFreesSourcesThatHoldThemselves) {
  struct Owner {
    std::unique_ptr<Source> source;
    std::unique_ptr<Source> timer;
    std::shared_ptr<int> held;
  };
  const auto held = std::make_shared<int>(1);
  {
    AsioQueues queues(2);
    auto owner = std::make_shared<Owner>();
    owner->held = held;
    auto queue = queues.makeSerialQueue("test");
    owner->source = queue->makeReadSource(_here.get(), [owner] {});
    owner->timer = queue->makeTimer(1h, 1h, [owner] {});
  }
  EXPECT_EQ(held.use_count(), 1);
}

}  // namespace
}  // namespace tallyd::platform
