#include "platform/ipc/SdBusServiceConnection.h"

#include <fmt/format.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>

#include <cassert>
#include <utility>

#include "platform/ipc/ValueReader.h"
#include "platform/ipc/ValueWriter.h"

namespace tallyd::platform {

namespace {

/// Who connected, at the time of connect(2).
std::optional<ucred> peerOf(int socket) {
  ucred peer{};
  socklen_t size = sizeof peer;
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return std::nullopt;
  return peer;
}

}  // namespace

/// A call under way. The library's message is kept as long as it may be answered.
class SdBusServiceConnection::Call final : public IncomingCall {
 public:
  Call(std::shared_ptr<SdBusServiceConnection> connection, BusMessage message, std::size_t methodIndex,
       ReadValues read)
      : _connection(std::move(connection)),
        _message(std::move(message)),
        _methodIndex(methodIndex),
        _expectsReply(_message != nullptr),
        _arguments(std::move(read.values)),
        _descriptors(std::move(read.descriptors)) {}
  ~Call() override {
    if (_message) _connection->releaseOnQueue(std::move(_message));
  }
  Call(const Call&) = delete;
  Call& operator=(const Call&) = delete;

  [[nodiscard]] std::size_t methodIndex() const override { return _methodIndex; }
  [[nodiscard]] const std::vector<Value>& arguments() const override { return _arguments; }
  [[nodiscard]] std::vector<FileDescriptor>& descriptors() override { return _descriptors; }
  [[nodiscard]] bool expectsReply() const override { return _expectsReply; }

  void reply(std::vector<Value> results) override {
    if (const auto message = std::exchange(_message, nullptr)) {
      _connection->answer(message.get(), _methodIndex, results);
    }
  }
  void rejectArguments(std::string_view reason) override {
    if (const auto message = std::exchange(_message, nullptr))
      _connection->reject(message.get(), std::string(reason));
  }

 private:
  const std::shared_ptr<SdBusServiceConnection> _connection;
  BusMessage _message;  ///< Null when no answer is wanted or one was given.
  const std::size_t _methodIndex;
  const bool _expectsReply;
  const std::vector<Value> _arguments;
  std::vector<FileDescriptor> _descriptors;
};

SdBusServiceConnection::SdBusServiceConnection(FileDescriptor socket, std::shared_ptr<Shared> shared,
                                               std::uint64_t number)
    : BusConnection(std::move(socket), shared->queues.makeSerialQueue("com.quillon.tallyd.connection")),
      _shared(std::move(shared)),
      _number(number) {}

SdBusServiceConnection::~SdBusServiceConnection() {
  dropBus();  // It still refers to the interface's table.
}

std::string SdBusServiceConnection::description() const {
  const auto peer = peerOf(descriptor());
  return peer ? fmt::format("client of process {}, user {}", peer->pid, peer->uid) : "client";
}

std::optional<uid_t> SdBusServiceConnection::peerUser() const {
  const auto peer = peerOf(descriptor());
  return peer ? std::optional(peer->uid) : std::nullopt;
}

void SdBusServiceConnection::setExportedInterface(const Interface& exported) {
  _interface = &_shared->interfaces.of(exported);
}

void SdBusServiceConnection::setExportedObject(std::shared_ptr<ExportedObject> object) {
  _object = std::move(object);
}

void SdBusServiceConnection::setInterruptionHandler(std::function<void()> handler) {
  _interruptionHandler = std::move(handler);
}

void SdBusServiceConnection::setInvalidationHandler(std::function<void()> handler) {
  _invalidationHandler = std::move(handler);
}

void SdBusServiceConnection::resume() {
  queue()->async([self = shared_from_this(), this] { start(); });
}

void SdBusServiceConnection::setUp(sd_bus* bus) {
  sd_id128_t identifier{};
  checkBus(sd_id128_randomize(&identifier), "sd_id128_randomize");
  checkBus(sd_bus_set_server(bus, 1, identifier), "sd_bus_set_server");
  checkBus(sd_bus_set_anonymous(bus, 1), "sd_bus_set_anonymous");
  checkBus(sd_bus_set_trusted(bus, 1), "sd_bus_set_trusted");
  checkBus(sd_bus_negotiate_fds(bus, 1), "sd_bus_negotiate_fds");
  if (_interface) _interface->addTo(bus, *this);
}

bool SdBusServiceConnection::incoming(sd_bus_message* message) {
  // Programs that think they talk to a bus greet it first.
  if (sd_bus_message_is_method_call(message, "org.freedesktop.DBus", "Hello") <= 0) return false;
  sd_bus_reply_method_return(message, "s", fmt::format(":1.{}", _number).c_str());
  return true;
}

void SdBusServiceConnection::receiveCall(sd_bus_message* message) {
  const auto index = _interface->methodIndex(sd_bus_message_get_member(message));
  auto read = readValues(message, _interface->description().methods[index].in);
  const bool wantsAnswer = sd_bus_message_get_expect_reply(message) > 0;
  if (read.problem) {
    if (wantsAnswer) reject(message, *read.problem);
    return;
  }
  const auto call =
      std::make_shared<Call>(std::static_pointer_cast<SdBusServiceConnection>(shared_from_this()),
                             wantsAnswer ? retainMessage(message) : nullptr, index, std::move(read));
  if (const auto object = _object) object->handleCall(call);
}

void SdBusServiceConnection::answer(sd_bus_message* call, std::size_t methodIndex,
                                    const std::vector<Value>& results) {
  if (!bus()) return;
  sd_bus_message* made = nullptr;
  if (sd_bus_message_new_method_return(call, &made) < 0) return;
  const auto message = adoptMessage(made);
  const auto problem = appendValues(made, _interface->description().methods[methodIndex].out, results, {});
  assert(!problem);
  if (problem) return sendError(call, SD_BUS_ERROR_FAILED, *problem);
  send(message);
}

void SdBusServiceConnection::reject(sd_bus_message* call, const std::string& reason) {
  if (bus()) sendError(call, SD_BUS_ERROR_INVALID_ARGS, reason);
}

void SdBusServiceConnection::sendError(sd_bus_message* call, const char* name, const std::string& reason) {
  sd_bus_message* made = nullptr;
  if (sd_bus_message_new_method_errorf(call, &made, name, "%s", reason.c_str()) < 0) return;
  send(adoptMessage(made));
}

void SdBusServiceConnection::send(const BusMessage& message) {
  // A failing write would end the connection before the calls that a client sent before it left have been
  // read.
  if (!peerHasGone()) sd_bus_send(bus(), message.get(), nullptr);
  wake();
}

void SdBusServiceConnection::releaseOnQueue(BusMessage message) const {
  queue()->async([message = std::move(message)] {});
}

void SdBusServiceConnection::ended(End end) {
  const auto object = std::exchange(_object, nullptr);
  const auto interruptionHandler = std::exchange(_interruptionHandler, nullptr);
  const auto invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  if (end == End::WithinMessage && interruptionHandler) interruptionHandler();
  if (invalidationHandler) invalidationHandler();
}

}  // namespace tallyd::platform
