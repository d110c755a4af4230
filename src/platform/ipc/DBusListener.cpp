#include "platform/ipc/DBusListener.h"

#include <sys/socket.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <mutex>
#include <utility>

#include "platform/Log.h"
#include "platform/SerialQueue.h"
#include "platform/ipc/DBusServiceConnection.h"

namespace tallyd::platform {

namespace {

constexpr int kAcceptsPerTurn = 64;  ///< Then other work of the queue's threads comes.
constexpr std::chrono::milliseconds kPauseWithoutResources{250};

}  // namespace

class DBusListener::Acceptor : public std::enable_shared_from_this<Acceptor> {
 public:
  Acceptor(std::unique_ptr<const ListeningSocket> socket, Queues& queues, Log& log)
      : _socket(std::move(socket)),
        _log(log),
        _queue(queues.makeSerialQueue("com.quillon.tallyd.listener")),
        _queues(queues) {}

  void setDelegate(ListenerDelegate& delegate) { _delegate = &delegate; }

  void listen() {
    const std::lock_guard lock(_mutex);
    if (_stopped || _source) return;
    _source =
        _queue->makeReadSource(_socket->descriptor(), [self = shared_from_this()] { self->acceptSome(); });
  }

  void stop() {
    const std::lock_guard lock(_mutex);
    _stopped = true;
    _source.reset();
  }

 private:
  void acceptSome() {
    const std::lock_guard lock(_mutex);
    for (int i = 0; i < kAcceptsPerTurn && !_stopped; ++i) {
      FileDescriptor client(::accept4(_socket->descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
      if (!client && !mayGoOn(errno)) return;
      if (client) welcome(std::move(client));
    }
  }

  void welcome(FileDescriptor client) {
    const auto connection = std::make_shared<DBusServiceConnection>(std::move(client), _queues, ++_accepted);
    if (_delegate) _delegate->shouldAcceptNewConnection(connection);
  }

  bool mayGoOn(int error) {
    if (error == EAGAIN) {
      _exhausted = false;  // Everybody who waited has been served.
      return false;
    }
    if (error == EINTR || error == ECONNABORTED) return true;
    if (!std::exchange(_exhausted, true)) {
      asl_log(_log, LogLevel::Critical, "Cannot accept connections at present: {}", std::strerror(error));
    }
    _source.reset();
    _queue->asyncAfter(kPauseWithoutResources, [self = shared_from_this()] { self->listen(); });
    return false;
  }

  const std::unique_ptr<const ListeningSocket> _socket;
  Log& _log;
  const std::shared_ptr<SerialQueue> _queue;
  Queues& _queues;
  ListenerDelegate* _delegate = nullptr;

  std::mutex _mutex;  ///< Held while accepting, so that stop() waits for it.
  std::unique_ptr<Source> _source;
  bool _stopped = false;
  bool _exhausted = false;  ///< Said so already.
  std::uint64_t _accepted = 0;
};

DBusListener::DBusListener(const std::filesystem::path& socketPath, Queues& queues, Log& log,
                           SocketAccess access)
    : DBusListener(std::make_unique<const ListeningSocket>(socketPath, access), queues, log) {}

DBusListener::DBusListener(std::unique_ptr<const ListeningSocket> socket, Queues& queues, Log& log)
    : _acceptor(std::make_shared<Acceptor>(std::move(socket), queues, log)) {}

DBusListener::~DBusListener() { _acceptor->stop(); }

void DBusListener::setDelegate(ListenerDelegate& delegate) { _acceptor->setDelegate(delegate); }

void DBusListener::resume() { _acceptor->listen(); }

}  // namespace tallyd::platform
