// What a running process takes: memory, descriptors, threads, processor time.
#pragma once

#include <sys/types.h>

#include <cstddef>

namespace tallyd::test {

/// At one instant; each of the figures is read by itself.
struct ProcessFigures {
  std::size_t residentBytes = 0;  ///< proc(5), VmRSS.
  std::size_t peakBytes = 0;      ///< VmHWM: the highest that residentBytes has been.
  std::size_t addressBytes = 0;   ///< VmSize: what RLIMIT_AS bounds.
  std::size_t threads = 0;
  std::size_t descriptors = 0;
  double processorSeconds = 0;  ///< User and system, of all threads.
};

/// Throws std::runtime_error when the process is not there, or belongs to somebody else.
[[nodiscard]] ProcessFigures figuresOf(pid_t process);

}  // namespace tallyd::test
