// Makes large allocations of the test's thread fail.
#pragma once

#include <cstddef>

namespace tallyd::test {

/// While it lives, the calling thread gets no memory of `smallestBytes` or more from operator new.
class FailingAllocation {
 public:
  explicit FailingAllocation(std::size_t smallestBytes);
  ~FailingAllocation();
  FailingAllocation(const FailingAllocation&) = delete;
  FailingAllocation& operator=(const FailingAllocation&) = delete;
};

}  // namespace tallyd::test
