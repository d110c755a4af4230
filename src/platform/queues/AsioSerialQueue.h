// A serial queue as a strand, and the sources that call on it.
#pragma once

#include <atomic>
#include <memory>
#include <mutex>
#include <new>
#include <string>
#include <unordered_set>

#include "platform/SerialQueue.h"
#include "platform/queues/DescriptorTable.h"

namespace tallyd::platform {

class Log;
class SourceState;

/// What the queues of one pool share.
struct EventLoop {
  Log* const log;  ///< Where work that throws is told of; may be null.
  std::unique_ptr<asio::io_context> context;
  DescriptorTable descriptors;
  std::atomic<bool> stopping{false};  ///< Nothing is taken any more; what is queued is being dropped.

  /// The sources that have not been cancelled. They hold their handlers, and these often whatever owns the
  /// source: when the loop ends nobody else would break that circle.
  std::mutex sourcesMutex;
  std::unordered_set<std::shared_ptr<SourceState>> sources;

  explicit EventLoop(Log* toBorrow);
  ~EventLoop();  ///< After the threads have been joined.
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;
};

class AsioSerialQueue final : public SerialQueue, public std::enable_shared_from_this<AsioSerialQueue> {
 public:
  AsioSerialQueue(EventLoop& loop, std::string label);
  ~AsioSerialQueue() override;
  AsioSerialQueue(const AsioSerialQueue&) = delete;
  AsioSerialQueue& operator=(const AsioSerialQueue&) = delete;

  [[nodiscard]] const std::string& label() const override { return _label; }
  void async(Work work) override;
  /// At once only on a thread of the pool.
  void dispatch(Work work) override;
  void asyncAfter(std::chrono::milliseconds delay, Work work) override;
  [[nodiscard]] std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first,
                                                  std::chrono::milliseconds period, Work handler,
                                                  Work cancelHandler) override;
  [[nodiscard]] std::unique_ptr<Source> makeReadSource(int descriptor, Work handler,
                                                       Work cancelHandler) override;
  [[nodiscard]] std::unique_ptr<Source> makeWriteSource(int descriptor, Work handler,
                                                        Work cancelHandler) override;

  /// Runs a piece of work, which may throw if there is a log to tell of it.
  void run(const Work& work) const noexcept;
  /// Takes a step without which nobody would hear of an event any more: no memory for it ends the process.
  template <class Step>
  void mustHaveMemory(const Step& step) const noexcept {
    try {
      step();
    } catch (const std::bad_alloc&) {
      endWithoutMemory();
    }
  }
  [[nodiscard]] EventLoop& loop() const { return _loop; }

 private:
  struct Strand;

  [[noreturn]] void endWithoutMemory() const noexcept;

  EventLoop& _loop;
  const std::string _label;
  std::unique_ptr<Strand> _strand;
};

/// A source's part that waits and calls; the handle that its maker holds is another object.
class SourceState : public std::enable_shared_from_this<SourceState> {
 public:
  SourceState(std::shared_ptr<AsioSerialQueue> queue, Work handler, Work cancelHandler);
  virtual ~SourceState() = default;
  SourceState(const SourceState&) = delete;
  SourceState& operator=(const SourceState&) = delete;

  void arm();  ///< Waits for the next event, unless cancelled. Throws std::bad_alloc.
  void rearm() noexcept;
  void cancel();  ///< Any thread.
  void drop();    ///< Gives up everything without a call; for the end of the loop.

 protected:
  virtual void wait() = 0;         ///< With the mutex held.
  virtual void stopWaiting() = 0;  ///< With the mutex held.
  void fire() noexcept;            ///< Calls the handler on the queue, then waits again.
  [[nodiscard]] AsioSerialQueue& queue() const { return *_queue; }
  template <class Derived>
  [[nodiscard]] std::shared_ptr<Derived> self() {
    return std::static_pointer_cast<Derived>(shared_from_this());
  }

 private:
  const std::shared_ptr<AsioSerialQueue> _queue;
  std::mutex _mutex;
  std::atomic<bool> _cancelled{false};
  Work _handler;        ///< The queue's.
  Work _cancelHandler;  ///< The queue's.
};

[[nodiscard]] std::unique_ptr<Source> makeTimerSource(std::shared_ptr<AsioSerialQueue> queue,
                                                      std::chrono::milliseconds first,
                                                      std::chrono::milliseconds period, Work handler,
                                                      Work cancelHandler);
[[nodiscard]] std::unique_ptr<Source> makeDescriptorSource(std::shared_ptr<AsioSerialQueue> queue,
                                                           int descriptor,
                                                           DescriptorTable::Direction direction, Work handler,
                                                           Work cancelHandler);

}  // namespace tallyd::platform
