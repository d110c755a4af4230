// Waits of the tests: until something is done, at most for a deadline that only a failing test reaches.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

namespace tallyd::platform {

/// Counts and lets others wait for a number.
class Gate {
 public:
  static constexpr std::chrono::seconds kDeadline{30};

  void pass() {
    const std::lock_guard lock(_mutex);
    ++_passed;
    _changed.notify_all();
  }
  [[nodiscard]] bool waitFor(int passes) {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, kDeadline, [&] { return _passed >= passes; });
  }
  [[nodiscard]] int passed() const {
    const std::lock_guard lock(_mutex);
    return _passed;
  }

 private:
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  int _passed = 0;
};

}  // namespace tallyd::platform
