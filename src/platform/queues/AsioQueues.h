// The production queues: strands over one event loop and a small pool of threads.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "platform/SerialQueue.h"

namespace tallyd::platform {

class Log;

/// Serial queues that share a pool of threads; a queue costs memory only.
///
/// The threads start with the first queue, so that a process can confine itself before. While a thread of the
/// pool waits in a blockingCall() another one takes its place.
///
/// An exception that leaves a piece of work ends the process; with a log, it costs that piece and a critical
/// line, and everything else goes on. Memory for the loop's own records of events, of some hundred bytes,
/// must be there: without it an event would never be heard of, and the process ends, after a critical line.
/// So must the last few bytes of a new queue: Asio's strand does not outlive a want of them.
///
/// Life cycle: the destructor stops and joins the threads and drops the work that has not started. The queues
/// and sources made here must be gone by then, but for those that only queued work and handlers hold.
class AsioQueues final : public Queues {
 public:
  static std::size_t defaultThreadCount();  ///< One for each core, but at least two.

  /// Borrows the log, if there is one.
  explicit AsioQueues(std::size_t threads = defaultThreadCount(), Log* log = nullptr);
  ~AsioQueues() override;
  AsioQueues(const AsioQueues&) = delete;
  AsioQueues& operator=(const AsioQueues&) = delete;

  [[nodiscard]] std::shared_ptr<SerialQueue> makeSerialQueue(std::string label) override;
  [[nodiscard]] std::unique_ptr<BlockingCall> blockingCall() override;

  [[nodiscard]] std::size_t threadCount() const;  ///< Threads alive, parked ones included.

 private:
  struct Parts;
  std::unique_ptr<Parts> _parts;
};

}  // namespace tallyd::platform
