#include "platform/ipc/DBusServiceConnection.h"

#include <fmt/format.h>
#include <sys/random.h>
#include <sys/socket.h>

#include <cassert>
#include <new>
#include <utility>

#include "platform/dbus/Authentication.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/Message.h"
#include "platform/ipc/StandardInterfaces.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kFailed = "org.freedesktop.DBus.Error.Failed";

/// Who connected, at the time of connect(2).
std::optional<ucred> peerOf(int socket) {
  ucred peer{};
  socklen_t size = sizeof peer;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return std::nullopt;
  return peer;
}

/// 128 random bits in hexadecimal; their use is to differ, so that a failing generator does no harm.
std::string serverIdentifier() {
  std::uint64_t bits[2]{};
  (void)::getrandom(bits, sizeof bits, GRND_NONBLOCK);
  return fmt::format("{:016x}{:016x}", bits[0], bits[1]);
}

}  // namespace

/// A call under way.
class DBusServiceConnection::Call final : public IncomingCall {
 public:
  Call(std::shared_ptr<DBusServiceConnection> connection, const dbus::Message& message,
       std::size_t methodIndex, dbus::ReadValues read)
      : _connection(std::move(connection)),
        _serial(message.fields.serial),
        _methodIndex(methodIndex),
        _expectsReply(message.fields.expectsReply()),
        _mayAnswer(_expectsReply),
        _arguments(std::move(read.values)),
        _descriptors(std::move(read.descriptors)) {}

  [[nodiscard]] std::size_t methodIndex() const override { return _methodIndex; }
  [[nodiscard]] const std::vector<Value>& arguments() const override { return _arguments; }
  [[nodiscard]] std::vector<FileDescriptor>& descriptors() override { return _descriptors; }
  [[nodiscard]] bool expectsReply() const override { return _expectsReply; }

  void reply(std::vector<Value> results) override {
    if (!std::exchange(_mayAnswer, false)) return;
    _connection->answer(_serial, _connection->_interface->methods[_methodIndex].out, results);
  }
  void rejectArguments(std::string_view reason) override {
    if (std::exchange(_mayAnswer, false)) _connection->answerWithError(_serial, kInvalidArguments, reason);
  }

 private:
  const std::shared_ptr<DBusServiceConnection> _connection;
  const std::uint32_t _serial;
  const std::size_t _methodIndex;
  const bool _expectsReply;
  bool _mayAnswer;
  const std::vector<Value> _arguments;
  std::vector<FileDescriptor> _descriptors;
};

DBusServiceConnection::DBusServiceConnection(FileDescriptor socket, Queues& queues, std::uint64_t number)
    : DBusConnection(std::move(socket), queues.makeSerialQueue("com.quillon.tallyd.connection")),
      _number(number) {}

DBusServiceConnection::~DBusServiceConnection() = default;

std::string DBusServiceConnection::description() const {
  const auto peer = peerOf(descriptor());
  return peer ? fmt::format("client of process {}, user {}", peer->pid, peer->uid) : "client";
}

std::optional<uid_t> DBusServiceConnection::peerUser() const {
  const auto peer = peerOf(descriptor());
  return peer ? std::optional(peer->uid) : std::nullopt;
}

void DBusServiceConnection::resume() {
  queue()->async([self = shared_from_this(), this] { startService(); });
}

/// Nobody else would tell the delegate of the end of a connection that never began.
void DBusServiceConnection::startService() {
  constexpr auto kNobody = static_cast<uid_t>(-1);
  try {
    start(std::make_unique<dbus::ServerAuthentication>(peerUser().value_or(kNobody), serverIdentifier()));
  } catch (const std::bad_alloc&) {
    end(End::BetweenMessages);
  }
}

void DBusServiceConnection::finish() {
  queue()->async([self = shared_from_this(), this] { endAfterInput(); });
}

void DBusServiceConnection::incoming(const dbus::Message& message, std::vector<FileDescriptor> descriptors) {
  if (message.fields.type != dbus::MessageType::MethodCall) return;
  const CallRoute route = routeCall(message, _interface, _number);
  if (route.methodIndex) return receiveCall(message, *route.methodIndex, std::move(descriptors));
  if (!message.fields.expectsReply()) return;
  if (!route.errorName.empty()) return answerWithError(message.fields.serial, route.errorName, route.reason);
  answer(message.fields.serial, route.signature, route.results);
}

void DBusServiceConnection::receiveCall(const dbus::Message& message, std::size_t methodIndex,
                                        std::vector<FileDescriptor> descriptors) {
  auto read = dbus::readBody(message.body, message.order, message.fields.signature, std::move(descriptors));
  if (read.problem) {
    if (message.fields.expectsReply())
      answerWithError(message.fields.serial, kInvalidArguments, *read.problem);
    return;
  }
  const auto call =
      std::make_shared<Call>(std::static_pointer_cast<DBusServiceConnection>(shared_from_this()), message,
                             methodIndex, std::move(read));
  if (const auto object = _object) object->handleCall(call);
}

void DBusServiceConnection::answer(std::uint32_t call, std::string_view signature,
                                   const std::vector<Value>& results) {
  const auto problem = write({.type = dbus::MessageType::MethodReturn,
                              .flags = dbus::NoReplyExpected,
                              .serial = nextSerial(),
                              .replySerial = call,
                              .signature = signature},
                             results);
  assert(!problem);
  if (problem) answerWithError(call, kFailed, *problem);
}

void DBusServiceConnection::answerWithError(std::uint32_t call, std::string_view name,
                                            std::string_view reason) {
  (void)write({.type = dbus::MessageType::Error,
               .flags = dbus::NoReplyExpected,
               .serial = nextSerial(),
               .errorName = name,
               .replySerial = call,
               .signature = "s"},
              {Value(reason)});
}

void DBusServiceConnection::ended(End end) {
  const auto object = std::exchange(_object, nullptr);
  const auto interruptionHandler = std::exchange(_interruptionHandler, nullptr);
  const auto invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  if (end == End::WithinMessage && interruptionHandler) {
    try {
      interruptionHandler();
    } catch (const std::bad_alloc&) {
      // The end itself must be heard of.
    }
  }
  if (invalidationHandler) invalidationHandler();
}

}  // namespace tallyd::platform
