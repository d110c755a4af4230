// The live tap: what leaves the daemon, and what does not, as lines for whoever listens at the moment.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Clock.h"
#include "platform/FileDescriptor.h"
#include "support/TapLine.h"

namespace tallyd::platform {
class Queues;
class SerialQueue;
}  // namespace tallyd::platform

namespace tallyd {

/// Copies JSON lines to the pipes and sockets of its listeners.
///
/// Whoever has something to show asks isListening() first and formats nothing otherwise. A writer only adds
/// its line to each listener's backlog; a serial queue of the tap's own does the writing, without blocking.
/// While 4 MiB or more wait for one listener, what comes is not kept for it but counted, and as soon as there
/// is room it gets the line {"time": …, "kind": "missed", "count": N}. So a listener costs at most
/// kMaximumBacklogBytes and one line. What there is no memory for is counted in the same way.
///
/// A listener whose other end has gone is found out with the next line for it.
///
/// Threading: any thread.
class Tap : public std::enable_shared_from_this<Tap> {
 public:
  static constexpr std::size_t kMaximumBacklogBytes = std::size_t{4} << 20;
  static constexpr std::size_t kMaximumListeners = 8;  ///< Somebody debugs; nobody needs more.

  /// Listening, for as long as it lives. Threading: any thread.
  class Subscription {
   public:
    virtual ~Subscription() = default;
  };

  /// Borrows both.
  Tap(platform::Queues& queues, const platform::Clock& clock);
  ~Tap();
  Tap(const Tap&) = delete;
  Tap& operator=(const Tap&) = delete;

  [[nodiscard]] bool isListening() const noexcept { return _isListening.load(std::memory_order_relaxed); }

  /// Writes every later line to `descriptor`, which must be a pipe's end or a socket and becomes non-blocking
  /// for all that share it. Null for anything else, and when kMaximumListeners listen.
  [[nodiscard]] std::unique_ptr<Subscription> listen(platform::FileDescriptor descriptor);

  /// A line of this kind, with the present time.
  [[nodiscard]] TapLine line(std::string_view kind) const { return {kind, _clock.now()}; }
  void write(TapLine line);
  /// Counts a line that could not be made.
  void miss();

  /// A number for what needs more than one line; never 0.
  [[nodiscard]] std::uint64_t nextNumber() { return ++_lastNumber; }

 private:
  struct Listener;
  class Membership;
  using SharedListener = std::shared_ptr<Listener>;
  using Text = std::shared_ptr<const std::string>;

  void append(const SharedListener& listener, const Text& text);
  void keepMissedLine(Listener& listener) const;
  void startPumping(const SharedListener& listener);
  void pump(const SharedListener& listener);
  void pumpSome(const SharedListener& listener);
  [[nodiscard]] Text front(Listener& listener);
  void wrote(Listener& listener, std::size_t bytes);
  void waitForRoom(const SharedListener& listener);
  void remove(const SharedListener& listener);

  const platform::Clock& _clock;
  const std::shared_ptr<platform::SerialQueue> _queue;
  std::atomic<bool> _isListening = false;
  std::atomic<std::uint64_t> _lastNumber = 0;
  mutable std::mutex _mutex;  ///< Guards the list and what listeners state as shared.
  std::vector<SharedListener> _listeners;
};

}  // namespace tallyd
