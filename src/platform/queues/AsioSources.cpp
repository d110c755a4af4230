#include <algorithm>
#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>
#include <new>
#include <utility>

#include "platform/queues/AsioSerialQueue.h"

namespace tallyd::platform {

namespace {

using Clock = std::chrono::steady_clock;

class TimerState final : public SourceState {
 public:
  TimerState(std::shared_ptr<AsioSerialQueue> onQueue, std::chrono::milliseconds first,
             std::chrono::milliseconds period, Work handler, Work cancelHandler)
      : SourceState(std::move(onQueue), std::move(handler), std::move(cancelHandler)),
        _timer(*queue().loop().context),
        _period(std::max(period, std::chrono::milliseconds(1))),
        _next(Clock::now() + first) {}

 private:
  void wait() override {
    if (_ticking) {
      const auto late = Clock::now() - _next;
      _next += (std::max(late, Clock::duration::zero()) / _period + 1) * _period;
    }
    _ticking = true;
    _timer.expires_at(_next);
    _timer.async_wait([state = self<TimerState>()](const asio::error_code& error) noexcept {
      if (!error) state->fire();
    });
  }
  void stopWaiting() override { _timer.cancel(); }

  asio::steady_timer _timer;
  const std::chrono::milliseconds _period;
  Clock::time_point _next;
  bool _ticking = false;  ///< The first tick has been waited for.
};

class DescriptorState final : public SourceState {
 public:
  DescriptorState(std::shared_ptr<AsioSerialQueue> onQueue, int descriptor,
                  DescriptorTable::Direction direction, Work handler, Work cancelHandler)
      : SourceState(std::move(onQueue), std::move(handler), std::move(cancelHandler)),
        _direction(direction),
        _share(queue().loop().descriptors.share(*queue().loop().context, descriptor)) {}

 private:
  void wait() override {
    _share.wait(_direction, [state = self<DescriptorState>()](DescriptorTable::Outcome outcome) {
      if (outcome == DescriptorTable::Outcome::Ready) {
        state->fire();
      } else {
        state->rearm();
      }
    });
  }
  void stopWaiting() override { _share = {}; }

  const DescriptorTable::Direction _direction;
  DescriptorTable::Share _share;
};

class SourceHandle final : public Source {
 public:
  SourceHandle() = default;
  ~SourceHandle() override {
    if (_state) _state->cancel();
  }
  SourceHandle(const SourceHandle&) = delete;
  SourceHandle& operator=(const SourceHandle&) = delete;

  /// Once, when the source has started.
  void hold(std::shared_ptr<SourceState> state) { _state = std::move(state); }
  void cancel() override { _state->cancel(); }

 private:
  std::shared_ptr<SourceState> _state;
};

void forgetSource(EventLoop& loop, const std::shared_ptr<SourceState>& state) {
  const std::lock_guard lock(loop.sourcesMutex);
  loop.sources.erase(state);
}

std::unique_ptr<Source> startSource(EventLoop& loop, std::shared_ptr<SourceState> state) {
  auto handle = std::make_unique<SourceHandle>();
  {
    const std::lock_guard lock(loop.sourcesMutex);
    loop.sources.insert(state);
  }
  try {
    state->arm();
  } catch (const std::bad_alloc&) {
    forgetSource(loop, state);
    state->drop();  // Its maker hears of the failure, and the cancel handler does not.
    throw;
  }
  handle->hold(std::move(state));
  return handle;
}

}  // namespace

SourceState::SourceState(std::shared_ptr<AsioSerialQueue> queue, Work handler, Work cancelHandler)
    : _queue(std::move(queue)), _handler(std::move(handler)), _cancelHandler(std::move(cancelHandler)) {}

void SourceState::arm() {
  const std::lock_guard lock(_mutex);
  if (!_cancelled) wait();
}

void SourceState::rearm() noexcept {
  _queue->mustHaveMemory([this] { arm(); });
}

void SourceState::fire() noexcept {
  _queue->mustHaveMemory([this] {
    _queue->dispatch([state = shared_from_this()] {
      if (state->_cancelled) return;
      state->_queue->run(state->_handler);
      state->rearm();
    });
  });
}

void SourceState::cancel() {
  {
    const std::lock_guard lock(_mutex);
    if (_cancelled.exchange(true)) return;
    stopWaiting();
  }
  const auto keptAlive = shared_from_this();
  forgetSource(_queue->loop(), keptAlive);
  // The handler may be under way: only the queue knows when it is safe to drop it.
  _queue->mustHaveMemory([&] {
    _queue->async([keptAlive] {
      keptAlive->_handler = {};
      if (const auto cancelHandler = std::exchange(keptAlive->_cancelHandler, {})) cancelHandler();
    });
  });
}

void SourceState::drop() {
  {
    const std::lock_guard lock(_mutex);
    if (!_cancelled.exchange(true)) stopWaiting();
  }
  // Taken out first: what they hold may destroy the source's handle.
  const auto handler = std::exchange(_handler, {});
  const auto cancelHandler = std::exchange(_cancelHandler, {});
}

std::unique_ptr<Source> makeTimerSource(std::shared_ptr<AsioSerialQueue> queue,
                                        std::chrono::milliseconds first, std::chrono::milliseconds period,
                                        Work handler, Work cancelHandler) {
  auto& loop = queue->loop();
  return startSource(loop, std::make_shared<TimerState>(std::move(queue), first, period, std::move(handler),
                                                        std::move(cancelHandler)));
}

std::unique_ptr<Source> makeDescriptorSource(std::shared_ptr<AsioSerialQueue> queue, int descriptor,
                                             DescriptorTable::Direction direction, Work handler,
                                             Work cancelHandler) {
  auto& loop = queue->loop();
  return startSource(loop, std::make_shared<DescriptorState>(std::move(queue), descriptor, direction,
                                                             std::move(handler), std::move(cancelHandler)));
}

}  // namespace tallyd::platform
