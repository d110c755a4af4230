// When a repeated sample is due, and waiting for it.
#pragma once

#include <chrono>

namespace tallyd::tallyctl {

using SteadyTime = std::chrono::steady_clock::time_point;

/// The times start + n * interval; they do not shift when a tick is served late.
class Ticks {
 public:
  Ticks(SteadyTime start, std::chrono::milliseconds interval) : _start(start), _interval(interval) {}

  /// The first tick after `now`; ticks that were missed are left out.
  [[nodiscard]] SteadyTime next(SteadyTime now) const {
    return _start + ((now - _start) / std::chrono::nanoseconds(_interval) + 1) * _interval;
  }

 private:
  SteadyTime _start;
  std::chrono::milliseconds _interval;
};

/// Time, and the wish to stop.
class Pacer {
 public:
  virtual ~Pacer() = default;
  [[nodiscard]] virtual SteadyTime now() = 0;
  /// Waits; false as soon as the program is to stop.
  [[nodiscard]] virtual bool waitUntil(SteadyTime time) = 0;
};

}  // namespace tallyd::tallyctl
