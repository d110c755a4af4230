// Serial queues: work that runs one piece at a time, in order, on threads that all queues share.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <utility>

namespace tallyd::platform {

using Work = std::function<void()>;

/// Something that calls a handler on its queue: a timer, or a descriptor that is ready. Destroying it cancels
/// it.
class Source {
 public:
  virtual ~Source() = default;

  /// No handler starts after this returns when it is called on the source's queue; from another thread one
  /// that is under way may still finish. The cancel handler then runs on the queue, once.
  virtual void cancel() = 0;
};

/// Runs work one piece at a time, in the order in which it was given. Holds only what is queued, no thread.
///
/// Work is to see to its own exceptions: one that leaves a piece of work ends that piece, or the process, as
/// the implementation says; a source whose handler throws is called again at its next event. What takes work
/// throws std::bad_alloc when there is no memory to keep it, and has not taken it then.
///
/// Threading: every operation may be called from any thread, also from the queue's own work. The queue lives
/// as long as anyone holds it or work is queued on it.
class SerialQueue {
 public:
  virtual ~SerialQueue() = default;

  [[nodiscard]] virtual const std::string& label() const = 0;

  virtual void async(Work work) = 0;
  /// As async(), or at once on this thread when the queue has nothing to do: for short work whose order on
  /// the queue matters, and not its thread. The caller must hold no lock that the work takes.
  virtual void dispatch(Work work) { async(std::move(work)); }
  virtual void asyncAfter(std::chrono::milliseconds delay, Work work) = 0;

  /// Calls `handler` after `first` and then every `period`; ticks that come late are not made up for.
  [[nodiscard]] virtual std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first,
                                                          std::chrono::milliseconds period, Work handler,
                                                          Work cancelHandler = {}) = 0;
  /// Calls `handler` while `descriptor` has something to read (or has hung up). Borrows the descriptor: it
  /// must stay open until the source is cancelled.
  [[nodiscard]] virtual std::unique_ptr<Source> makeReadSource(int descriptor, Work handler,
                                                               Work cancelHandler = {}) = 0;
  /// The same while `descriptor` can be written.
  [[nodiscard]] virtual std::unique_ptr<Source> makeWriteSource(int descriptor, Work handler,
                                                                Work cancelHandler = {}) = 0;
};

/// Makes queues and knows which of their work blocks.
class Queues {
 public:
  /// While it lives, the calling thread is waiting for something outside the process and another thread takes
  /// its place, so that blocked work delays nothing else.
  class BlockingCall {
   public:
    virtual ~BlockingCall() = default;
  };

  virtual ~Queues() = default;
  [[nodiscard]] virtual std::shared_ptr<SerialQueue> makeSerialQueue(std::string label) = 0;
  [[nodiscard]] virtual std::unique_ptr<BlockingCall> blockingCall() = 0;
};

}  // namespace tallyd::platform
