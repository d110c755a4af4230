#include "framework/LinkThread.h"

#include <csignal>
#include <random>
#include <utility>

#include "framework/SocketServiceChannel.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd {

namespace {

/// Threads that are started while it lives start with every signal blocked: handlers are for the program's
/// own threads.
class BlockedSignals {
 public:
  BlockedSignals() {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~BlockedSignals() { pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  BlockedSignals(const BlockedSignals&) = delete;
  BlockedSignals& operator=(const BlockedSignals&) = delete;

 private:
  sigset_t _before{};
};

std::function<double()> randomDraws() {
  return [engine = std::minstd_rand(std::random_device{}())]() mutable {
    return std::uniform_real_distribution<double>()(engine);
  };
}

ServiceConnector connectorFor(const TallyConnectionOptions& options,
                              const std::shared_ptr<platform::SerialQueue>& queue) {
  if (options.reconnect == TallyReconnect::WhenLost) return socketConnector(options.socketPath, queue);
  return oneTimeConnector(connectedSocket(options.socketPath, options.timeout), queue);
}

}  // namespace

LinkThread::LinkThread(const TallyConnectionOptions& options)
    : _closeTimeout(options.closeTimeout), _queues(std::make_unique<platform::AsioQueues>(1)) {
  const BlockedSignals blocked;
  auto queue = _queues->makeSerialQueue("com.quillon.tally.connection");
  auto connector = connectorFor(options, queue);
  _link = std::make_shared<ServiceLink>(
      options, ServiceLink::Environment{std::move(queue), std::move(connector),
                                        std::chrono::steady_clock::now, randomDraws()});
  _link->start();
}

LinkThread::~LinkThread() { _link->close(_closeTimeout); }

}  // namespace tallyd
