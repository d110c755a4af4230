#include "platform/queues/AsioQueues.h"

#include <algorithm>
#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <thread>
#include <utility>

#include "platform/queues/AsioSerialQueue.h"
#include "platform/queues/GrowingPool.h"

namespace tallyd::platform {

struct AsioQueues::Parts {
  Parts(std::size_t threads, Log* log)
      : loop(log),
        idle(asio::make_work_guard(*loop.context)),
        pool(*loop.context, std::max<std::size_t>(threads, 1)) {}

  EventLoop loop;
  asio::executor_work_guard<asio::io_context::executor_type>
      idle;          ///< Keeps the threads when there is nothing to do.
  GrowingPool pool;  ///< Last: it is joined before anything else goes.
};

namespace {

class PoolBlockingCall final : public Queues::BlockingCall {
 public:
  explicit PoolBlockingCall(GrowingPool& pool) : _pool(pool), _counted(pool.beginBlocking()) {}
  ~PoolBlockingCall() override {
    if (_counted) _pool.endBlocking();
  }
  PoolBlockingCall(const PoolBlockingCall&) = delete;
  PoolBlockingCall& operator=(const PoolBlockingCall&) = delete;

 private:
  GrowingPool& _pool;
  const bool _counted;
};

}  // namespace

std::size_t AsioQueues::defaultThreadCount() {
  return std::max<std::size_t>(std::thread::hardware_concurrency(), 2);
}

AsioQueues::AsioQueues(std::size_t threads, Log* log) : _parts(std::make_unique<Parts>(threads, log)) {}

AsioQueues::~AsioQueues() = default;

std::shared_ptr<SerialQueue> AsioQueues::makeSerialQueue(std::string label) {
  _parts->pool.start();
  return std::make_shared<AsioSerialQueue>(_parts->loop, std::move(label));
}

std::unique_ptr<Queues::BlockingCall> AsioQueues::blockingCall() {
  return std::make_unique<PoolBlockingCall>(_parts->pool);
}

std::size_t AsioQueues::threadCount() const { return _parts->pool.threadCount(); }

}  // namespace tallyd::platform
