#include "platform/queues/GrowingPool.h"

#include <csignal>

#include <asio/io_context.hpp>
#include <exception>

namespace tallyd::platform {

namespace {

thread_local const GrowingPool* poolOfThisThread = nullptr;

/// New threads inherit the mask: signals stay with the threads that the program meant them for.
class AllSignalsBlocked {
 public:
  AllSignalsBlocked() {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~AllSignalsBlocked() { pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  AllSignalsBlocked(const AllSignalsBlocked&) = delete;
  AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

 private:
  sigset_t _before{};
};

}  // namespace

GrowingPool::GrowingPool(asio::io_context& loop, std::size_t threads)
    : _loop(loop), _wanted(static_cast<long>(threads)) {}

GrowingPool::~GrowingPool() { stop(); }

void GrowingPool::start() {
  const std::lock_guard lock(_mutex);
  if (_started) return;
  while (_running < _wanted) startThread();
  _started = true;
}

void GrowingPool::stop() {
  Threads all;
  {
    const std::lock_guard lock(_mutex);
    _stopped = true;
    _wakeUp.notify_all();
  }
  _loop.stop();
  for (;;) {
    {
      const std::lock_guard lock(_mutex);
      all.splice(all.end(), _ended);
      if (all.empty() && !_threads.empty()) all.splice(all.end(), _threads, _threads.begin());
    }
    if (all.empty()) return;
    for (auto& thread : all) thread.join();
    all.clear();
  }
}

bool GrowingPool::beginBlocking() {
  if (poolOfThisThread != this) return false;
  Threads ended;
  {
    const std::lock_guard lock(_mutex);
    ended.swap(_ended);
    --_running;
    if (_running < _wanted && !_stopped) {
      if (_parked > _recalled) {
        ++_recalled;
        ++_running;
        _wakeUp.notify_one();
      } else {
        try {
          startThread();
        } catch (const std::exception&) {
          // No thread to be had, or no memory for it: the others go on alone until this one is back.
        }
      }
    }
  }
  for (auto& thread : ended) thread.join();
  return true;
}

void GrowingPool::endBlocking() {
  const std::lock_guard lock(_mutex);
  ++_running;
}

std::size_t GrowingPool::threadCount() const {
  const std::lock_guard lock(_mutex);
  return _threads.size();
}

void GrowingPool::startThread() {
  const AllSignalsBlocked blocked;
  const auto self = _threads.emplace(_threads.end());
  try {
    *self = std::thread([this, self] { run(self); });
  } catch (...) {
    _threads.erase(self);
    throw;
  }
  ++_running;
}

void GrowingPool::run(Threads::iterator self) {
  poolOfThisThread = this;
  while (mayRun()) _loop.run_one();
  const std::lock_guard lock(_mutex);
  if (!_stopped) _ended.splice(_ended.end(), _threads, self);
}

bool GrowingPool::mayRun() {
  if (_stopped) return false;
  if (_running <= _wanted) return true;
  std::unique_lock lock(_mutex);
  while (!_stopped) {
    if (_running <= _wanted) return true;
    --_running;
    if (!park(lock)) return false;
  }
  return false;
}

bool GrowingPool::park(std::unique_lock<std::mutex>& lock) {
  if (_parked >= kMaximumParked) return false;
  ++_parked;
  _wakeUp.wait_for(lock, kSpareLife, [this] { return _stopped || _recalled > 0; });
  --_parked;
  if (_recalled == 0) return false;
  --_recalled;
  return true;
}

}  // namespace tallyd::platform
