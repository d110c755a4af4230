// Threads that run one event loop, and the stand-ins for those that wait for something outside the process.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <list>
#include <mutex>
#include <thread>

namespace asio {
class io_context;
}

namespace tallyd::platform {

/// Keeps a fixed number of threads running the loop: a thread that blocks is stood in for by another one as
/// long as it does, and the surplus parks afterwards.
///
/// Bounds: as many threads as `threads` and blocked calls together, and kMaximumParked spare ones, which
/// leave after kSpareLife without work. A machine that gives no stand-in, or no memory for one, makes the
/// pool narrower, not an error. Threading: any thread; stop() and the destructor not on a thread of the pool.
class GrowingPool {
 public:
  static constexpr std::size_t kMaximumParked = 8;  ///< More is cheaper to start anew than to keep.
  static constexpr std::chrono::seconds kSpareLife{5};

  /// Borrows the loop; starts no thread.
  GrowingPool(asio::io_context& loop, std::size_t threads);
  ~GrowingPool();
  GrowingPool(const GrowingPool&) = delete;
  GrowingPool& operator=(const GrowingPool&) = delete;

  /// Starts the threads; once all have been started, a further call does nothing. Throws std::system_error or
  /// std::bad_alloc when one can't be.
  void start();
  /// Ends the loop and joins every thread.
  void stop();

  /// The calling thread is about to wait. False, and nothing to end, when it is no thread of this pool.
  [[nodiscard]] bool beginBlocking();
  void endBlocking();

  [[nodiscard]] std::size_t threadCount() const;  ///< Those that run, wait or are parked.

 private:
  using Threads = std::list<std::thread>;

  void startThread();
  void run(Threads::iterator self);
  bool mayRun();
  bool park(std::unique_lock<std::mutex>& lock);

  asio::io_context& _loop;
  const long _wanted;
  std::atomic<long> _running{
      0};  ///< Written under the mutex; read without it to see that there is no surplus.
  std::atomic<bool> _stopped{false};

  mutable std::mutex _mutex;
  std::condition_variable _wakeUp;
  bool _started = false;
  std::size_t _parked = 0;
  std::size_t _recalled = 0;  ///< Parked threads that were told to run again and have not woken yet.
  Threads _threads;
  Threads _ended;  ///< Have left run(), or are just about to; to be joined.
};

}  // namespace tallyd::platform
