// The descriptors that an event loop watches: one registration for each, however many sources use it.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <unordered_map>

namespace asio {
class io_context;
}

namespace tallyd::platform {

/// The kernel's event queue takes a descriptor only once, but a read and a write source may share one.
///
/// Threading: any thread.
class DescriptorTable {
  struct Registration;

 public:
  enum class Direction { Read, Write };
  enum class Outcome {
    Ready,
    Again,  ///< The wait was ended by another source of the descriptor; to be asked for anew.
  };

  /// One source's share of a registration. Destroying it ends its wait; the last one takes the descriptor
  /// from the loop, after which it may be closed.
  class Share {
   public:
    Share() = default;
    Share(Share&& other) noexcept;
    Share& operator=(Share&& other) noexcept;
    ~Share();

    explicit operator bool() const { return _registration != nullptr; }
    /// Calls `done` once, on a thread of the loop, also when the wait is ended.
    void wait(Direction direction, std::function<void(Outcome)> done);

   private:
    friend class DescriptorTable;
    Share(DescriptorTable& table, Registration& registration)
        : _table(&table), _registration(&registration) {}

    DescriptorTable* _table = nullptr;
    Registration* _registration = nullptr;
  };

  DescriptorTable();
  ~DescriptorTable();  ///< No share may be left.
  DescriptorTable(const DescriptorTable&) = delete;
  DescriptorTable& operator=(const DescriptorTable&) = delete;

  /// Borrows the descriptor and makes it non-blocking. Throws std::system_error when the loop does not take
  /// it.
  [[nodiscard]] Share share(asio::io_context& loop, int descriptor);

 private:
  void giveBack(Registration& registration);

  std::mutex _mutex;
  std::unordered_map<int, std::unique_ptr<Registration>> _registrations;
};

}  // namespace tallyd::platform
