// The agent lets go of sessions also when memory is out.

#include <gtest/gtest.h>

#include <new>
#include <thread>

#include "AgentFixture.h"
#include "support/FailingAllocation.h"

namespace tallyd {
namespace {

class AgentMemoryTest : public AgentFixture {
 protected:
  /// Ends a connection while its `number`-th allocation fails; false when there are not as many.
  static bool invalidateWithout(int number, fakes::FakeServiceConnection& connection) {
    const test::OneFailingAllocation failing(std::this_thread::get_id(), number);
    try {
      connection.invalidate();
    } catch (const std::bad_alloc&) {
      // As a connection's queue does.
    }
    return failing.hasFailed();
  }
};

TEST_F(AgentMemoryTest, NothingHoldsASessionWhicheverAllocationFailsAtItsEnd) {
  const auto ledger = std::make_shared<Ledger>();
  TallydAgent booking(platform, ledger);
  int number = 0;
  for (bool failed = true; failed;) {
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    ASSERT_TRUE(booking.shouldAcceptNewConnection(connection));
    configure(connection, 1, 5, some(userInfo("phone", "calls")));
    connection->call("StartConfig");
    EXPECT_FALSE(ledger->isSettled());
    failed = invalidateWithout(++number, *connection);
    connection.reset();
    fake.queues.run();
    EXPECT_TRUE(ledger->isSettled()) << "allocation " << number;
  }
  EXPECT_GT(number, 1);
}

}  // namespace
}  // namespace tallyd
