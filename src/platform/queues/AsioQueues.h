// The production queues: strands over one event loop and a small pool of threads.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "platform/SerialQueue.h"

namespace tallyd::platform {

/// Serial queues that share a pool of threads; a queue costs memory only.
///
/// The threads start with the first queue, so that a process can confine itself before. While a thread of the
/// pool waits in a blockingCall() another one takes its place.
///
/// Life cycle: the destructor stops and joins the threads and drops the work that has not started. The queues
/// and sources made here must be gone by then, but for those that only queued work and handlers hold.
class AsioQueues final : public Queues {
 public:
  static std::size_t defaultThreadCount();  ///< One for each core, but at least two.

  explicit AsioQueues(std::size_t threads = defaultThreadCount());
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
