// Makes chosen allocations fail.
#pragma once

#include <cstddef>
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

/// While it lives, the calling thread gets no memory of `smallestBytes` or more from operator new.
class FailingLargeAllocations {
 public:
  explicit FailingLargeAllocations(std::size_t smallestBytes);
  ~FailingLargeAllocations();
  FailingLargeAllocations(const FailingLargeAllocations&) = delete;
  FailingLargeAllocations& operator=(const FailingLargeAllocations&) = delete;
};

}  // namespace tallyd::test
