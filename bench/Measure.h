// Clocks, counters of a process, and medians.
#pragma once

#include <sched.h>
#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <utility>
#include <vector>

namespace tallyd::bench {

/// Seconds since its construction.
class Stopwatch {
 public:
  [[nodiscard]] double seconds() const {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - _start).count();
  }

 private:
  std::chrono::steady_clock::time_point _start = std::chrono::steady_clock::now();
};

/// The middle value, or the mean of the two in the middle; `values` must not be empty.
[[nodiscard]] double median(std::vector<double> values);

/// Seconds of processor time, user and system, of all threads of the process. Throws std::system_error.
[[nodiscard]] double processorSecondsOf(pid_t process);
/// The same of the calling thread.
[[nodiscard]] double processorSecondsOfThisThread();

/// While it lives, this thread and what it starts, threads and processes, run on one processor.
class OneProcessor {
 public:
  OneProcessor();  ///< Takes the processor that it finds itself on.
  ~OneProcessor();
  OneProcessor(const OneProcessor&) = delete;
  OneProcessor& operator=(const OneProcessor&) = delete;

 private:
  cpu_set_t _before{};
};

struct Memory {
  std::size_t residentBytes = 0;
  std::size_t peakBytes = 0;  ///< The highest that residentBytes has been.
};
/// From /proc/PID/status (proc(5): VmRSS and VmHWM). Throws std::runtime_error when it can't be read.
[[nodiscard]] Memory memoryOf(pid_t process);

/// The median time of so many calls, in microseconds.
template <class Call>
[[nodiscard]] double medianMicroseconds(int calls, Call&& call) {
  constexpr double kMicroseconds = 1e6;
  std::vector<double> times;
  for (int i = 0; i < calls; ++i) {
    const Stopwatch stopwatch;
    call();
    times.push_back(stopwatch.seconds() * kMicroseconds);
  }
  return median(std::move(times));
}

/// Keeps the optimiser from leaving out what `value` is made by.
template <class T>
void keep(const T& value) {
  asm volatile("" : : "r,m"(value) : "memory");
}

}  // namespace tallyd::bench
