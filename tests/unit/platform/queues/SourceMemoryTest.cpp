// Memory that runs out while a source is made.

#include <gtest/gtest.h>
#include <sys/eventfd.h>

#include <functional>
#include <new>
#include <optional>
#include <thread>

#include "Gate.h"
#include "platform/FileDescriptor.h"
#include "platform/queues/AsioQueues.h"
#include "support/FailingAllocation.h"

namespace tallyd::platform {
namespace {

using namespace std::chrono_literals;
using test::OneFailingAllocation;

class SourceMemoryTest : public testing::Test {
 protected:
  using Make = std::function<std::unique_ptr<Source>(Work handler, Work cancelHandler)>;

  /// Makes the source once for each allocation that it takes, which then fails, and once with all of them.
  void expectAllOrNothing(const Make& make) {
    int refused = 0;
    std::unique_ptr<Source> source;
    Gate events;
    Gate cancelled;
    for (int number = 1; !source; ++number) {
      ASSERT_LT(number, 100);
      Work handler = [&events] { events.pass(); };
      Work cancelHandler = [&cancelled] { cancelled.pass(); };
      std::optional<OneFailingAllocation> failing(std::in_place, std::this_thread::get_id(), number);
      try {
        source = make(std::move(handler), std::move(cancelHandler));
      } catch (const std::bad_alloc&) {
        ++refused;
      }
    }
    EXPECT_GT(refused, 0);
    EXPECT_TRUE(events.waitFor(1));
    EXPECT_EQ(cancelled.passed(), 0) << "nobody has got a source that could have been cancelled";
    source.reset();
    EXPECT_TRUE(cancelled.waitFor(1));
  }

  AsioQueues queues{1};
  std::shared_ptr<SerialQueue> queue = queues.makeSerialQueue("test");
};

TEST_F(SourceMemoryTest, ATimerIsMadeWholeOrNotAtAll) {
  expectAllOrNothing([this](Work handler, Work cancelHandler) {
    return queue->makeTimer(1ms, 1h, std::move(handler), std::move(cancelHandler));
  });
}

TEST_F(SourceMemoryTest, AReadSourceIsMadeWholeOrNotAtAll) {
  const FileDescriptor readable(::eventfd(1, EFD_CLOEXEC | EFD_NONBLOCK));
  expectAllOrNothing([&](Work handler, Work cancelHandler) {
    return queue->makeReadSource(readable.get(), std::move(handler), std::move(cancelHandler));
  });
}

}  // namespace
}  // namespace tallyd::platform
