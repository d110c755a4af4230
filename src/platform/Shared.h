// Reference-counted storage of values: one word a reference, and a safe answer to "am I the only one?".
#pragma once

#include <atomic>
#include <cstddef>
#include <utility>

namespace tallyd::platform {

/// A counted reference to a T, copied on change.
///
/// Unlike std::shared_ptr it can tell, in a way that orders memory, that no other reference is left, so that
/// a value which once was shared with another thread may be changed in place.
///
/// Threading: the counted object may be shared by any threads; one Shared belongs to one thread at a time.
template <class T>
class Shared {
 public:
  Shared() = default;
  explicit Shared(T value) : _box(new Box{std::move(value)}) {}
  Shared(const Shared& other) noexcept : _box(other._box) {
    if (_box) _box->count.fetch_add(1, std::memory_order_relaxed);
  }
  Shared(Shared&& other) noexcept : _box(std::exchange(other._box, nullptr)) {}
  Shared& operator=(Shared other) noexcept {
    std::swap(_box, other._box);
    return *this;
  }
  ~Shared() {
    if (_box && _box->count.fetch_sub(1, std::memory_order_acq_rel) == 1) delete _box;
  }

  explicit operator bool() const noexcept { return _box != nullptr; }
  const T& operator*() const noexcept { return _box->value; }
  const T* operator->() const noexcept { return &_box->value; }

  /// Others refer to the object too.
  [[nodiscard]] bool isShared() const noexcept {
    return _box && _box->count.load(std::memory_order_acquire) > 1;
  }
  /// The object for changing: made when there is none, copied when others refer to it too.
  T& unique() {
    if (!_box) {
      *this = Shared(T());
    } else if (isShared()) {
      *this = Shared(_box->value);
    }
    return _box->value;
  }

 private:
  struct Box {
    T value;
    std::atomic<std::size_t> count{1};
  };
  Box* _box = nullptr;
};

}  // namespace tallyd::platform
