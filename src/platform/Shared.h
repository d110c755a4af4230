// Reference-counted storage of values: one word a reference.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstring>
#include <new>
#include <string_view>
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

/// An immutable text, counted like a Shared, in one piece of memory with its count.
///
/// Threading: as Shared's.
class SharedText {
 public:
  explicit SharedText(std::string_view text)
      : _box(static_cast<Box*>(::operator new(sizeof(Box) + text.size()))) {
    new (_box) Box{{1}, text.size()};
    if (!text.empty()) std::memcpy(bytes(), text.data(), text.size());
  }
  SharedText(const SharedText& other) noexcept : _box(other._box) {
    if (_box) _box->count.fetch_add(1, std::memory_order_relaxed);
  }
  SharedText(SharedText&& other) noexcept : _box(std::exchange(other._box, nullptr)) {}
  SharedText& operator=(SharedText other) noexcept {
    std::swap(_box, other._box);
    return *this;
  }
  ~SharedText() {
    if (_box && _box->count.fetch_sub(1, std::memory_order_acq_rel) == 1) ::operator delete(_box);
  }

  [[nodiscard]] std::string_view view() const noexcept {
    return _box ? std::string_view(bytes(), _box->size) : std::string_view();
  }
  bool operator==(const SharedText& other) const noexcept { return view() == other.view(); }

 private:
  struct Box {
    std::atomic<std::size_t> count;
    std::size_t size;
  };
  /// Behind the box.
  [[nodiscard]] char* bytes() const noexcept { return reinterpret_cast<char*>(_box + 1); }

  Box* _box;
};

}  // namespace tallyd::platform
