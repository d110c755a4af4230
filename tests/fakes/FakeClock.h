// A clock that stands until the test moves it.
#pragma once

#include <atomic>

#include "platform/Clock.h"

namespace tallyd::fakes {

class FakeClock : public platform::Clock {
 public:
  /// Starts at 2026-01-15 12:00:00 UTC.
  FakeClock() : _microseconds(1'768'478'400'000'000) {}

  [[nodiscard]] platform::TimePoint now() const override {
    return platform::TimePoint(std::chrono::microseconds(_microseconds.load()));
  }
  void set(std::chrono::microseconds since1970) { _microseconds = since1970.count(); }
  void advance(std::chrono::microseconds step) { _microseconds += step.count(); }

 private:
  std::atomic<std::int64_t> _microseconds;
};

}  // namespace tallyd::fakes
