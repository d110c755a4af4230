// Makes one chosen allocation of one thread fail.
#pragma once

#include <thread>

namespace tallyd::test {

/// While it lives, the `number`-th allocation by operator new from now on fails that `thread` makes; numbers
/// begin at 1. One at a time in a process.
class OneFailingAllocation {
 public:
  OneFailingAllocation(std::thread::id thread, int number);
  ~OneFailingAllocation();
  OneFailingAllocation(const OneFailingAllocation&) = delete;
  OneFailingAllocation& operator=(const OneFailingAllocation&) = delete;

  /// False when the thread has not made as many allocations.
  [[nodiscard]] bool hasFailed() const;
};

}  // namespace tallyd::test
