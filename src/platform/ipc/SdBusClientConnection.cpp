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
  Completion completion;
};

namespace {

constexpr std::uint64_t kMaximumLibraryQueue = 64;
constexpr const char* kConnectionEnded = "the connection to the service has ended";

FileDescriptor connectedSocket(const std::filesystem::path& path) {
  const auto fail = [&path](int error) {
    throw std::system_error(error, std::system_category(), "cannot connect to " + path.string());
  };
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string name = path.string();
  if (name.size() >= sizeof address.sun_path) fail(ENAMETOOLONG);
  std::memcpy(address.sun_path, name.c_str(), name.size() + 1);
  // Connected while it still blocks: with a full backlog a non-blocking one would fail.
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket) fail(errno);
  int result = 0;
  do {
    result = ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  } while (result != 0 && errno == EINTR);
  if (result != 0) fail(errno);
  return socket;
}

}  // namespace

std::shared_ptr<SdBusClientConnection> SdBusClientConnection::connect(const std::filesystem::path& socketPath,
                                                                      const Interface& interface,
                                                                      Queues& queues) {
  auto connection = std::make_shared<SdBusClientConnection>(
      connectedSocket(socketPath), interface, queues.makeSerialQueue("com.quillon.tally.connection"));
  connection->queue()->async([connection] { connection->start(); });
  return connection;
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
    if (call.completion) call.completion({kConnectionEnded, {}});
    return;
  }
  _waiting.push_back(std::move(call));
  if (sendWaiting()) wake();
}

bool SdBusClientConnection::sendWaiting() {
  if (!bus() || sd_bus_is_ready(bus()) <= 0) return false;
  bool sent = false;
  // The library moves its whole queue for each message that leaves: it is kept short.
  while (!_waiting.empty() && queuedMessages() < kMaximumLibraryQueue) {
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
    if (call.completion) call.completion({std::move(reason), {}});
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
      std::make_unique<Pending>(Pending{*this, number, request.methodIndex, std::move(completion)});
  const auto callback = [](sd_bus_message* reply, void* userData, sd_bus_error* error) {
    return handleReply(reply, userData, error);
  };
  const auto patience = static_cast<std::uint64_t>(std::max<std::int64_t>(timeout.count(), 1)) * 1'000;
  const int sent = sd_bus_call_async(bus(), nullptr, made, callback, pending.get(), patience);
  auto& kept = _pending[number] = std::move(pending);
  if (sent < 0) finish(kept->number, {std::strerror(-sent), {}});
}

int SdBusClientConnection::handleReply(sd_bus_message* message, void* pendingCall, void* /*error*/) noexcept {
  const auto& pending = *static_cast<Pending*>(pendingCall);
  auto& connection = pending.connection;
  if (const auto* error = sd_bus_message_get_error(message)) {
    connection.finish(pending.number, {error->message ? error->message : error->name, {}});
    return 0;
  }
  const auto& out = connection._interface.methods[pending.methodIndex].out;
  if (sd_bus_message_has_signature(message, out.c_str()) <= 0) {
    connection.finish(pending.number, {"the answer is of other types than it must be", {}});
    return 0;
  }
  auto read = readValues(message, out);
  connection.finish(pending.number, {std::move(read.problem), std::move(read.values)});
  return 0;
}

void SdBusClientConnection::finish(std::uint64_t number, Reply reply) {
  auto node = _pending.extract(number);
  if (!node.empty()) node.mapped()->completion(std::move(reply));
}

bool SdBusClientConnection::settled() {
  if (sendWaiting()) return true;
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
  for (const auto& each : pending) each.second->completion({kConnectionEnded, {}});
  for (const auto& each : waiting) {
    if (each.completion) each.completion({kConnectionEnded, {}});
  }
  if (!_closing) {
    _brokeOff = !invalidationHandler;
    if (end == End::WithinMessage && interruptionHandler) interruptionHandler();
    if (invalidationHandler) invalidationHandler();
  }
  const std::lock_guard lock(_closedMutex);
  _closed = true;
  _closedChanged.notify_all();
}

void SdBusClientConnection::close(std::chrono::milliseconds patience) {
  queue()->async([self = shared_from_this(), this] {
    _closing = true;
    if (bus()) {
      wake();
    } else {
      end(End::BetweenMessages);
    }
  });
  std::unique_lock lock(_closedMutex);
  if (_closedChanged.wait_for(lock, patience, [this] { return _closed; })) return;
  lock.unlock();
  queue()->async([self = shared_from_this(), this] { end(End::BetweenMessages); });
  lock.lock();
  _closedChanged.wait(lock, [this] { return _closed; });
}

}  // namespace tallyd::platform
