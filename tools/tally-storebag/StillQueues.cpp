#include "tally-storebag/StillQueues.h"

namespace tallyd::storebagtool {

using platform::Source;
using platform::Work;

namespace {

class StillSource final : public Source {
 public:
  void cancel() override {}
};

class StillQueue final : public platform::SerialQueue {
 public:
  StillQueue(std::shared_ptr<std::deque<Work>> work, std::string label)
      : _work(std::move(work)), _label(std::move(label)) {}

  [[nodiscard]] const std::string& label() const override { return _label; }
  void async(Work work) override { _work->push_back(std::move(work)); }
  void asyncAfter(std::chrono::milliseconds /*delay*/, Work /*work*/) override {}
  [[nodiscard]] std::unique_ptr<Source> makeTimer(std::chrono::milliseconds /*first*/,
                                                  std::chrono::milliseconds /*period*/, Work /*handler*/,
                                                  Work /*cancelHandler*/) override {
    return std::make_unique<StillSource>();
  }
  [[nodiscard]] std::unique_ptr<Source> makeReadSource(int /*descriptor*/, Work /*handler*/,
                                                       Work /*cancelHandler*/) override {
    return std::make_unique<StillSource>();
  }
  [[nodiscard]] std::unique_ptr<Source> makeWriteSource(int /*descriptor*/, Work /*handler*/,
                                                        Work /*cancelHandler*/) override {
    return std::make_unique<StillSource>();
  }

 private:
  const std::shared_ptr<std::deque<Work>> _work;
  const std::string _label;
};

}  // namespace

std::shared_ptr<platform::SerialQueue> StillQueues::makeSerialQueue(std::string label) {
  return std::make_shared<StillQueue>(_work, std::move(label));
}

std::unique_ptr<platform::Queues::BlockingCall> StillQueues::blockingCall() {
  return std::make_unique<BlockingCall>();
}

void StillQueues::run() {
  while (!_work->empty()) {
    const Work work = std::move(_work->front());
    _work->pop_front();
    work();
  }
}

}  // namespace tallyd::storebagtool
