// Serial queues on which no time passes: work runs when it is asked for, timers and descriptors never fire.
#pragma once

#include <deque>
#include <memory>

#include "platform/SerialQueue.h"

namespace tallyd::storebagtool {

/// All queues share one list of work. What is delayed is dropped, and so are the handlers of sources, so that
/// nothing holds its maker longer than the maker's own user does. Threading: one thread.
class StillQueues final : public platform::Queues {
 public:
  [[nodiscard]] std::shared_ptr<platform::SerialQueue> makeSerialQueue(std::string label) override;
  [[nodiscard]] std::unique_ptr<BlockingCall> blockingCall() override;

  /// Runs all work, also what that work adds.
  void run();

 private:
  using WorkList = std::deque<platform::Work>;
  std::shared_ptr<WorkList> _work = std::make_shared<WorkList>();
};

}  // namespace tallyd::storebagtool
