// The time of day.
#pragma once

#include <sys/time.h>

#include <chrono>

#include "platform/Value.h"

namespace tallyd::platform {

using TimePoint = std::chrono::system_clock::time_point;

/// The wall clock; it may be set forwards and backwards at any time. Threading: any thread.
class Clock {
 public:
  virtual ~Clock() = default;
  [[nodiscard]] virtual TimePoint now() const = 0;

  /// Seconds and microseconds since 1970, as gettimeofday(2) gives them.
  [[nodiscard]] timeval timeOfDay() const;
};

/// Seconds since 1970, with fractions.
[[nodiscard]] double secondsSince1970(TimePoint time);
[[nodiscard]] Date dateFromTimePoint(TimePoint time);
[[nodiscard]] TimePoint timePointFromDate(Date date);

}  // namespace tallyd::platform
