// Serial queues that run when the test says so, on time that the test moves.
#pragma once

#include <poll.h>

#include <algorithm>
#include <atomic>
#include <deque>
#include <map>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "platform/SerialQueue.h"

namespace tallyd::fakes {

/// All queues share one list of work in the order of arrival and one timeline.
///
/// Work may be given from any thread; `run` and `advance` belong to the test's thread.
class FakeQueues : public platform::Queues {
 public:
  using Work = platform::Work;
  using Milliseconds = std::chrono::milliseconds;

  std::shared_ptr<platform::SerialQueue> makeSerialQueue(std::string label) override {
    return std::make_shared<Queue>(_state, std::move(label));
  }
  std::unique_ptr<BlockingCall> blockingCall() override {
    ++blockingCalls;
    return std::make_unique<BlockingCall>();
  }

  /// Runs all work that is due, also what that work adds.
  void run() {
    while (Work work = _state->take()) work();
  }
  /// Moves the time on, running what falls due in its order.
  void advance(Milliseconds step) {
    run();
    const Milliseconds end = _state->now + step;
    while (_state->fireNext(end)) run();
    _state->now = end;
  }
  /// Moves the time on to what falls due next, and runs that; to `end`, and false, when nothing does until
  /// then.
  bool advanceToNext(Milliseconds end) {
    run();
    if (_state->fireNext(end)) {
      run();
      return true;
    }
    _state->now = std::max(_state->now, end);
    return false;
  }
  /// Calls the handlers of descriptors that have something to read, until none has, and runs all work.
  void serveReadable() {
    do run();
    while (_state->giveReadable());
  }
  [[nodiscard]] Milliseconds now() const { return _state->now; }
  [[nodiscard]] std::size_t armedTimers() const { return _state->timers.size(); }
  /// Queues that somebody holds.
  [[nodiscard]] std::size_t liveQueues() const { return _state->queues; }

  /// So many more pieces of work find no memory to be kept in.
  void refuseWork(int pieces) { _state->refusals = pieces; }
  /// Whether what is to wait finds none.
  void refuseTimers(bool refuse) { _state->refusesTimers = refuse; }

  std::size_t blockingCalls = 0;

 private:
  struct State {
    std::mutex mutex;
    std::deque<Work> ready;
    std::multimap<Milliseconds, std::pair<int, Work>> timers;
    std::map<int, std::pair<int, Work>> readers;  ///< By their IDs: descriptor and handler.
    Milliseconds now{0};
    int nextID = 1;
    std::atomic<std::size_t> queues = 0;
    std::atomic<int> refusals = 0;
    std::atomic<bool> refusesTimers = false;

    void give(Work work) {
      const std::lock_guard lock(mutex);
      if (refusals > 0 && refusals-- > 0) throw std::bad_alloc();
      ready.push_back(std::move(work));
    }
    Work take() {
      const std::lock_guard lock(mutex);
      if (ready.empty()) return {};
      Work work = std::move(ready.front());
      ready.pop_front();
      return work;
    }
    int arm(Milliseconds delay, Work work) {
      if (refusesTimers) throw std::bad_alloc();
      const std::lock_guard lock(mutex);
      timers.emplace(now + delay, std::pair(nextID, std::move(work)));
      return nextID++;
    }
    void disarm(int id) {
      const std::lock_guard lock(mutex);
      std::erase_if(timers, [id](const auto& timer) { return timer.second.first == id; });
    }
    int watch(int descriptor, Work handler) {
      const std::lock_guard lock(mutex);
      readers.emplace(nextID, std::pair(descriptor, std::move(handler)));
      return nextID++;
    }
    void unwatch(int id) {
      const std::lock_guard lock(mutex);
      readers.erase(id);
    }
    bool giveReadable() {
      const std::lock_guard lock(mutex);
      bool any = false;
      for (const auto& [id, reader] : readers) {
        pollfd readable{.fd = reader.first, .events = POLLIN, .revents = 0};
        if (::poll(&readable, 1, 0) != 1) continue;
        ready.push_back(reader.second);
        any = true;
      }
      return any;
    }
    bool fireNext(Milliseconds end) {
      const std::lock_guard lock(mutex);
      if (timers.empty() || timers.begin()->first > end) return false;
      now = std::max(now, timers.begin()->first);
      ready.push_back(std::move(timers.begin()->second.second));
      timers.erase(timers.begin());
      return true;
    }
  };

  class Timer : public platform::Source {
   public:
    Timer(std::shared_ptr<State> state, Milliseconds first, Milliseconds period, Work handler,
          Work cancelHandler)
        : _core(std::make_shared<Core>(Core{std::move(state), period, std::move(handler), 0, false})),
          _cancelHandler(std::move(cancelHandler)) {
      arm(_core, first);
    }
    ~Timer() override { cancel(); }
    void cancel() override {
      if (std::exchange(_core->cancelled, true)) return;
      _core->state->disarm(_core->armed);
      if (_cancelHandler) _core->state->give(_cancelHandler);
    }

   private:
    struct Core {
      std::shared_ptr<State> state;
      Milliseconds period;
      Work handler;
      int armed;
      bool cancelled;
    };
    static void arm(const std::shared_ptr<Core>& core, Milliseconds delay) {
      core->armed = core->state->arm(delay, [core] {
        if (core->cancelled) return;
        arm(core, core->period);
        core->handler();
      });
    }
    std::shared_ptr<Core> _core;
    Work _cancelHandler;
  };

  /// Fires when the test serves what is readable.
  class ReadSource : public platform::Source {
   public:
    ReadSource(std::shared_ptr<State> state, int descriptor, Work handler, Work cancelHandler)
        : _state(std::move(state)),
          _id(_state->watch(descriptor, std::move(handler))),
          _cancelHandler(std::move(cancelHandler)) {}
    ~ReadSource() override { cancel(); }
    void cancel() override {
      _state->unwatch(_id);
      if (_cancelHandler) _state->give(std::exchange(_cancelHandler, {}));
    }

   private:
    std::shared_ptr<State> _state;
    const int _id;
    Work _cancelHandler;
  };

  /// A source that never fires: what waits to write is tested on real queues.
  class IdleSource : public platform::Source {
   public:
    IdleSource(std::shared_ptr<State> state, Work cancelHandler)
        : _state(std::move(state)), _cancelHandler(std::move(cancelHandler)) {}
    ~IdleSource() override { cancel(); }
    void cancel() override {
      if (_cancelHandler) _state->give(std::exchange(_cancelHandler, {}));
    }

   private:
    std::shared_ptr<State> _state;
    Work _cancelHandler;
  };

  class Queue : public platform::SerialQueue {
   public:
    Queue(std::shared_ptr<State> state, std::string label)
        : _state(std::move(state)), _label(std::move(label)) {
      ++_state->queues;
    }
    ~Queue() override { --_state->queues; }
    const std::string& label() const override { return _label; }
    void async(Work work) override { _state->give(std::move(work)); }
    void asyncAfter(Milliseconds delay, Work work) override { _state->arm(delay, std::move(work)); }
    std::unique_ptr<platform::Source> makeTimer(Milliseconds first, Milliseconds period, Work handler,
                                                Work cancelHandler) override {
      return std::make_unique<Timer>(_state, first, period, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<platform::Source> makeReadSource(int descriptor, Work handler,
                                                     Work cancelHandler) override {
      return std::make_unique<ReadSource>(_state, descriptor, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<platform::Source> makeWriteSource(int, Work, Work cancelHandler) override {
      return std::make_unique<IdleSource>(_state, std::move(cancelHandler));
    }

   private:
    std::shared_ptr<State> _state;
    std::string _label;
  };

  std::shared_ptr<State> _state = std::make_shared<State>();
};

}  // namespace tallyd::fakes
