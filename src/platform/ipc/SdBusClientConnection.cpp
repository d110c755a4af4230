#include "platform/ipc/SdBusClientConnection.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include "platform/ipc/ValueReader.h"
#include "platform/ipc/ValueWriter.h"

namespace tallyd::platform {

struct SdBusClientConnection::Pending {
  SdBusClientConnection& connection;
  const std::uint64_t number;
  const std::size_t methodIndex;
  const std::chrono::milliseconds timeout;
  Completion completion;
};

namespace {

constexpr std::uint64_t kMaximumLibraryQueue = 64;
constexpr const char* kConnectionEnded = "the connection to the service has ended";

timeval timevalOf(std::chrono::milliseconds time) {
  return {.tv_sec = time.count() / 1'000, .tv_usec = time.count() % 1'000 * 1'000};
}

}  // namespace

std::shared_ptr<SdBusClientConnection> SdBusClientConnection::connect(const std::filesystem::path& socketPath,
                                                                      const Interface& interface,
                                                                      Queues& queues) {
  constexpr std::chrono::seconds kPatience{60};
  auto connection =
      std::make_shared<SdBusClientConnection>(connectedSocket(socketPath, kPatience), interface,
                                              queues.makeSerialQueue("com.quillon.tally.connection"));
  connection->queue()->async([connection] { connection->start(); });
  return connection;
}

FileDescriptor SdBusClientConnection::connectedSocket(const std::filesystem::path& path,
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

SdBusClientConnection::SdBusClientConnection(FileDescriptor socket, const Interface& interface,
                                             std::shared_ptr<SerialQueue> queue)
    : BusConnection(std::move(socket), std::move(queue)), _interface(interface) {}

SdBusClientConnection::~SdBusClientConnection() = default;

void SdBusClientConnection::setUp(sd_bus* bus) {
  checkBus(sd_bus_negotiate_fds(bus, 1), "sd_bus_negotiate_fds");
}

void SdBusClientConnection::setInterruptionHandler(std::function<void()> handler) {
  queue()->async([self = shared_from_this(), this, handler = std::move(handler)]() mutable {
    if (!_over) _interruptionHandler = std::move(handler);
  });
}

void SdBusClientConnection::setInvalidationHandler(std::function<void()> handler) {
  queue()->async([self = shared_from_this(), this, handler = std::move(handler)]() mutable {
    if (!_over) {
      _invalidationHandler = std::move(handler);
    } else if (handler && std::exchange(_brokeOff, false)) {
      handler();
    }
  });
}

void SdBusClientConnection::call(Request request, std::chrono::milliseconds timeout, Completion completion) {
  // Work must be copyable, a descriptor is not.
  const auto made = std::make_shared<Waiting>(Waiting{std::move(request), timeout, std::move(completion)});
  queue()->async([self = shared_from_this(), this, made] { submit(std::move(*made)); });
}

void SdBusClientConnection::submit(Waiting call) {
  if (_over) {
    if (call.completion) call.completion({kConnectionEnded, {}, Outcome::Disconnected});
    return;
  }
  _waiting.push_back(std::move(call));
  if (sendWaiting()) wake();
}

bool SdBusClientConnection::isReady() const {
  // The library moves its whole queue for each message that leaves: it is kept short.
  return bus() && sd_bus_is_ready(bus()) > 0 && queuedMessages() < kMaximumLibraryQueue;
}

void SdBusClientConnection::callNow(Request request, std::chrono::milliseconds timeout,
                                    Completion completion) {
  submit({std::move(request), timeout, std::move(completion)});
}

bool SdBusClientConnection::sendWaiting() {
  bool sent = false;
  while (!_waiting.empty() && isReady()) {
    auto call = std::move(_waiting.front());
    _waiting.pop_front();
    send(std::move(call));
    sent = true;
  }
  return sent;
}

void SdBusClientConnection::send(Waiting call) {
  auto& [request, timeout, completion] = call;
  const auto& method = _interface.methods[request.methodIndex];
  const auto fail = [&call](std::string reason) {
    if (call.completion) call.completion({std::move(reason), {}, Outcome::NotSent});
  };
  sd_bus_message* made = nullptr;
  const int result = sd_bus_message_new_method_call(bus(), &made, nullptr, _interface.objectPath.c_str(),
                                                    _interface.name.c_str(), method.name.c_str());
  if (result < 0) return fail(std::strerror(-result));
  const auto message = adoptMessage(made);
  if (const auto problem = appendValues(made, method.in, request.arguments, request.descriptors))
    return fail(*problem);
  if (!completion) {
    sd_bus_message_set_expect_reply(made, 0);
    sd_bus_send(bus(), made, nullptr);
    return;
  }
  const auto number = ++_lastNumber;
  auto pending =
      std::make_unique<Pending>(Pending{*this, number, request.methodIndex, timeout, std::move(completion)});
  const auto callback = [](sd_bus_message* reply, void* userData, sd_bus_error* error) {
    return handleReply(reply, userData, error);
  };
  const auto patience = static_cast<std::uint64_t>(std::max<std::int64_t>(timeout.count(), 1)) * 1'000;
  const int sent = sd_bus_call_async(bus(), nullptr, made, callback, pending.get(), patience);
  auto& kept = _pending[number] = std::move(pending);
  if (sent < 0) complete(kept->number, {std::strerror(-sent), {}, Outcome::NotSent});
}

SdBusClientConnection::Reply SdBusClientConnection::failedReply(const char* name, const char* message,
                                                                std::chrono::milliseconds timeout) const {
  // The library itself answers with this error when the time is over and when the connection ends.
  if (std::strcmp(name, SD_BUS_ERROR_NO_REPLY) == 0) {
    if (sd_bus_is_open(bus()) <= 0) return {kConnectionEnded, {}, Outcome::Disconnected};
    return {"no answer within " + std::to_string(timeout.count()) + " ms", {}, Outcome::TimedOut};
  }
  return {message ? message : name, {}, Outcome::Rejected};
}

int SdBusClientConnection::handleReply(sd_bus_message* message, void* pendingCall, void* /*error*/) noexcept {
  const auto& pending = *static_cast<Pending*>(pendingCall);
  auto& connection = pending.connection;
  if (const auto* error = sd_bus_message_get_error(message)) {
    connection.complete(pending.number, connection.failedReply(error->name, error->message, pending.timeout));
    return 0;
  }
  const auto& out = connection._interface.methods[pending.methodIndex].out;
  if (sd_bus_message_has_signature(message, out.c_str()) <= 0) {
    connection.complete(pending.number,
                        {"the answer is of other types than it must be", {}, Outcome::Rejected});
    return 0;
  }
  auto read = readValues(message, out);
  const auto outcome = read.problem ? Outcome::Rejected : Outcome::Answered;
  connection.complete(pending.number, {std::move(read.problem), std::move(read.values), outcome});
  return 0;
}

void SdBusClientConnection::complete(std::uint64_t number, Reply reply) {
  auto node = _pending.extract(number);
  if (!node.empty()) node.mapped()->completion(std::move(reply));
}

bool SdBusClientConnection::settled() {
  if (sendWaiting()) return true;
  if (_ownerReady && !_closing && isReady() && _ownerReady()) return true;
  if (!_closing || !_waiting.empty() || queuedMessages() > 0) return false;
  if (_pending.empty()) {
    end(End::BetweenMessages);
  } else if (!std::exchange(_halfClosed, true)) {
    // The service hears everything, answers it, and then closes its side. Closed at once, its first answer
    // would end the connection and with it the calls that it had not read.
    ::shutdown(descriptor(), SHUT_WR);
  }
  return false;
}

void SdBusClientConnection::ended(End end) {
  _over = true;
  const auto waiting = std::exchange(_waiting, {});
  const auto pending = std::exchange(_pending, {});
  const auto interruptionHandler = std::exchange(_interruptionHandler, nullptr);
  const auto invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  const auto ownerEnded = std::exchange(_ownerEnded, nullptr);
  _ownerReady = nullptr;
  for (const auto& each : pending) each.second->completion({kConnectionEnded, {}, Outcome::Disconnected});
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

void SdBusClientConnection::setOwner(std::function<bool()> ready,
                                     std::function<void(bool withinMessage)> ended) {
  _ownerReady = std::move(ready);
  _ownerEnded = std::move(ended);
}

void SdBusClientConnection::finish() {
  _closing = true;
  if (bus()) {
    wake();
  } else {
    end(End::BetweenMessages);
  }
}

void SdBusClientConnection::abort() {
  _closing = true;
  end(End::BetweenMessages);
}

void SdBusClientConnection::close(std::chrono::milliseconds patience) {
  queue()->async([self = shared_from_this(), this] { finish(); });
  std::unique_lock lock(_closedMutex);
  if (_closedChanged.wait_for(lock, patience, [this] { return _closed; })) return;
  lock.unlock();
  queue()->async([self = shared_from_this(), this] { abort(); });
  lock.lock();
  _closedChanged.wait(lock, [this] { return _closed; });
}

}  // namespace tallyd::platform
