// A value that can be reached only through its lock.
#pragma once

#include <mutex>
#include <utility>

namespace tallyd {

/// Threading: any thread; what `use` is given must not call back into the same Guarded.
template <class T>
class Guarded {
 public:
  Guarded() = default;
  explicit Guarded(T value) : _value(std::move(value)) {}

  template <class Use>
  decltype(auto) withLock(Use&& use) const {
    const std::lock_guard lock(_mutex);
    return std::forward<Use>(use)(std::as_const(_value));
  }

  [[nodiscard]] T copy() const {
    const std::lock_guard lock(_mutex);
    return _value;
  }

  void set(T value) {
    // The old value is left in the parameter, which outlives the lock: its destructor may take its time.
    const std::lock_guard lock(_mutex);
    std::swap(_value, value);
  }

 private:
  mutable std::mutex _mutex;
  T _value;
};

}  // namespace tallyd
