#include "platform/ipc/DBusClientConnection.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include "platform/dbus/Authentication.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/Message.h"

namespace tallyd::platform {

namespace {

constexpr const char* kConnectionEnded = "the connection to the service has ended";

timeval timevalOf(std::chrono::milliseconds time) {
  return {.tv_sec = time.count() / 1'000, .tv_usec = time.count() % 1'000 * 1'000};
}

}  // namespace

std::shared_ptr<DBusClientConnection> DBusClientConnection::connect(const std::filesystem::path& socketPath,
                                                                    const Interface& interface,
                                                                    Queues& queues) {
  constexpr std::chrono::seconds kPatience{60};
  auto connection =
      std::make_shared<DBusClientConnection>(connectedSocket(socketPath, kPatience), interface,
                                             queues.makeSerialQueue("com.quillon.tally.connection"));
  connection->queue()->async([connection] { connection->start(); });
  return connection;
}

FileDescriptor DBusClientConnection::connectedSocket(const std::filesystem::path& path,
                                                     std::chrono::milliseconds patience) {
  const auto fail = [&path](int error) {
    throw std::system_error(error, std::system_category(), "cannot connect to " + path.string());
  };
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string name = path.string();
  if (name.size() >= sizeof address.sun_path) fail(ENAMETOOLONG);
  std::memcpy(address.sun_path, name.c_str(), name.size() + 1);
  // With a full backlog a socket that does not block fails at once; one that blocks waits for as long as it
  // may send (unix(7) has no readiness for this). A time of zero would be forever.
  const bool waits = patience > std::chrono::milliseconds::zero();
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | (waits ? 0 : SOCK_NONBLOCK), 0));
  if (!socket) fail(errno);
  const timeval time = timevalOf(patience);
  if (waits) ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &time, sizeof time);
  int result = 0;
  do {
    result = ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  } while (result != 0 && errno == EINTR);
  if (result != 0) fail(errno == EAGAIN && waits ? ETIMEDOUT : errno);
  return socket;
}

DBusClientConnection::DBusClientConnection(FileDescriptor socket, const Interface& interface,
                                           std::shared_ptr<SerialQueue> queue)
    : DBusConnection(std::move(socket), std::move(queue)), _interface(interface) {}

DBusClientConnection::~DBusClientConnection() = default;

void DBusClientConnection::start() { DBusConnection::start(std::make_unique<dbus::ClientAuthentication>()); }

void DBusClientConnection::setInterruptionHandler(std::function<void()> handler) {
  queue()->async([self = shared_from_this(), this, handler = std::move(handler)]() mutable {
    if (!_over) _interruptionHandler = std::move(handler);
  });
}

void DBusClientConnection::setInvalidationHandler(std::function<void()> handler) {
  queue()->async([self = shared_from_this(), this, handler = std::move(handler)]() mutable {
    if (!_over) {
      _invalidationHandler = std::move(handler);
    } else if (handler && std::exchange(_brokeOff, false)) {
      handler();
    }
  });
}

void DBusClientConnection::call(Request request, std::chrono::milliseconds timeout, Completion completion) {
  // Work must be copyable, a descriptor is not.
  const auto made = std::make_shared<Waiting>(Waiting{std::move(request), timeout, std::move(completion)});
  queue()->async([self = shared_from_this(), this, made] { submit(std::move(*made)); });
}

void DBusClientConnection::submit(Waiting call) {
  if (_over) {
    if (call.completion) call.completion({kConnectionEnded, {}, Outcome::Disconnected});
    return;
  }
  _waiting.push_back(std::move(call));
  sendWaiting();
}

bool DBusClientConnection::isReady() const {
  return _waiting.empty() && isAuthenticated() && !isClogged() && !peerHasClosed();
}

void DBusClientConnection::callNow(Request request, std::chrono::milliseconds timeout,
                                   Completion completion) {
  submit({std::move(request), timeout, std::move(completion)});
}

bool DBusClientConnection::sendWaiting() {
  bool sent = false;
  while (!_waiting.empty() && isAuthenticated() && !isClogged()) {
    auto call = std::move(_waiting.front());
    _waiting.pop_front();
    send(std::move(call));
    sent = true;
  }
  return sent;
}

void DBusClientConnection::send(Waiting call) {
  auto& [request, timeout, completion] = call;
  const InterfaceMethod& method = _interface.methods[request.methodIndex];
  const std::uint32_t serial = nextSerial();
  const auto problem = write({.type = dbus::MessageType::MethodCall,
                              .flags = completion ? std::uint8_t{0} : std::uint8_t{dbus::NoReplyExpected},
                              .serial = serial,
                              .path = _interface.objectPath,
                              .interface = _interface.name,
                              .member = method.name,
                              .signature = method.in},
                             request.arguments, std::move(request.descriptors));
  if (!completion) return;
  if (problem) return completion({*problem, {}, Outcome::NotSent});
  const Moment deadline = std::chrono::steady_clock::now() + std::max(timeout, std::chrono::milliseconds(1));
  _pending.emplace(serial, Pending{request.methodIndex, timeout, deadline, std::move(completion)});
  watchDeadline(deadline);
}

void DBusClientConnection::incoming(const dbus::Message& message, std::vector<FileDescriptor> /*unused*/) {
  const bool isAnswer = message.fields.type == dbus::MessageType::MethodReturn ||
                        message.fields.type == dbus::MessageType::Error;
  if (!isAnswer) return;
  const auto pending = _pending.find(*message.fields.replySerial);
  if (pending == _pending.end()) return;
  complete(pending->first, replyOf(message, _interface.methods[pending->second.methodIndex].out));
}

DBusClientConnection::Reply DBusClientConnection::replyOf(const dbus::Message& message,
                                                          std::string_view signature) {
  const bool isError = message.fields.type == dbus::MessageType::Error;
  if (!isError && message.fields.signature != signature)
    return {"the answer is of other types than it must be", {}, Outcome::Rejected};
  auto read = dbus::readBody(message.body, message.order, message.fields.signature, {});
  if (isError) {
    const auto text = read.values.empty() ? std::nullopt : read.values[0].string();
    return {std::string(text.value_or(message.fields.errorName)), {}, Outcome::Rejected};
  }
  const auto outcome = read.problem ? Outcome::Rejected : Outcome::Answered;
  return {std::move(read.problem), std::move(read.values), outcome};
}

void DBusClientConnection::complete(std::uint32_t serial, Reply reply) {
  auto node = _pending.extract(serial);
  if (_pending.empty()) _timer.reset();
  if (!node.empty()) node.mapped().completion(std::move(reply));
}

/// A timer that fires early does no harm; making one for each of many calls would.
void DBusClientConnection::watchDeadline(Moment deadline) {
  if (_timer && _timerMoment <= deadline) return;
  constexpr std::chrono::milliseconds kAgain{1'000};
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
  const auto delay = std::max(left, std::chrono::milliseconds(0));
  _timerMoment = deadline;
  _timer = queue()->makeTimer(
      delay, kAgain, [self = shared_from_this()] { static_cast<DBusClientConnection&>(*self).expire(); });
}

void DBusClientConnection::expire() {
  const Moment now = std::chrono::steady_clock::now();
  std::vector<std::uint32_t> late;
  Moment next = Moment::max();
  for (const auto& [serial, pending] : _pending) {
    if (pending.deadline <= now) {
      late.push_back(serial);
    } else {
      next = std::min(next, pending.deadline);
    }
  }
  _timer.reset();
  if (next != Moment::max()) watchDeadline(next);
  for (const std::uint32_t serial : late) {
    const auto pending = _pending.find(serial);
    if (pending == _pending.end()) continue;  // A completion has ended the connection.
    complete(serial, {"no answer within " + std::to_string(pending->second.timeout.count()) + " ms",
                      {},
                      Outcome::TimedOut});
  }
  wake();
}

bool DBusClientConnection::drained() {
  if (sendWaiting()) return true;
  if (_ownerReady && !_closing && isReady() && _ownerReady()) return true;
  if (!_closing || !_waiting.empty() || hasOutput()) return false;
  if (_pending.empty()) {
    end(End::BetweenMessages);
  } else if (!std::exchange(_halfClosed, true)) {
    // The service hears everything, answers it, and then closes its side. Closed at once, its first answer
    // would end the connection and with it the calls that it had not read.
    ::shutdown(descriptor(), SHUT_WR);
  }
  return false;
}

void DBusClientConnection::ended(End end) {
  _over = true;
  const auto waiting = std::exchange(_waiting, {});
  const auto pending = std::exchange(_pending, {});
  const auto interruptionHandler = std::exchange(_interruptionHandler, nullptr);
  const auto invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  const auto ownerEnded = std::exchange(_ownerEnded, nullptr);
  _ownerReady = nullptr;
  _timer.reset();
  for (const auto& each : pending) each.second.completion({kConnectionEnded, {}, Outcome::Disconnected});
  for (const auto& each : waiting) {
    if (each.completion) each.completion({kConnectionEnded, {}, Outcome::Disconnected});
  }
  if (!_closing) {
    _brokeOff = !invalidationHandler;
    if (end == End::WithinMessage && interruptionHandler) interruptionHandler();
    if (invalidationHandler) invalidationHandler();
  }
  if (ownerEnded) ownerEnded(end == End::WithinMessage);
  const std::lock_guard lock(_closedMutex);
  _closed = true;
  _closedChanged.notify_all();
}

void DBusClientConnection::setOwner(std::function<bool()> ready,
                                    std::function<void(bool withinMessage)> ended) {
  _ownerReady = std::move(ready);
  _ownerEnded = std::move(ended);
}

void DBusClientConnection::finish() {
  _closing = true;
  if (isStarted() && isOpen()) {
    wake();
  } else {
    end(End::BetweenMessages);
  }
}

void DBusClientConnection::abort() {
  _closing = true;
  end(End::BetweenMessages);
}

void DBusClientConnection::close(std::chrono::milliseconds patience) {
  queue()->async([self = shared_from_this(), this] { finish(); });
  std::unique_lock lock(_closedMutex);
  if (_closedChanged.wait_for(lock, patience, [this] { return _closed; })) return;
  lock.unlock();
  queue()->async([self = shared_from_this(), this] { abort(); });
  lock.lock();
  _closedChanged.wait(lock, [this] { return _closed; });
}

}  // namespace tallyd::platform
