#include "framework/SocketServiceChannel.h"

#include <system_error>
#include <utility>

#include "platform/ipc/DBusClientConnection.h"

namespace tallyd {

using platform::DBusClientConnection;
using platform::FileDescriptor;

namespace {

TallyError kindOf(DBusClientConnection::Outcome outcome) {
  switch (outcome) {
    case DBusClientConnection::Outcome::Answered:
      return TallyError::None;
    case DBusClientConnection::Outcome::Rejected:
      return TallyError::Rejected;
    case DBusClientConnection::Outcome::NotSent:
      return TallyError::Argument;
    case DBusClientConnection::Outcome::TimedOut:
      return TallyError::TimedOut;
    case DBusClientConnection::Outcome::Disconnected:
      return TallyError::Disconnected;
  }
  return TallyError::Disconnected;
}

class SocketServiceChannel final : public ServiceChannel {
 public:
  SocketServiceChannel(FileDescriptor socket, std::shared_ptr<platform::SerialQueue> queue, Events events)
      : _connection(
            std::make_shared<DBusClientConnection>(std::move(socket), clientSessionInterface(), queue)) {
    _connection->setOwner(std::move(events.ready), std::move(events.ended));
    // The first event must not come before the owner has the channel.
    queue->async([connection = _connection] { connection->start(); });
  }

  [[nodiscard]] bool isReady() const override { return _connection->isReady(); }

  void call(ServiceRequest request, std::chrono::milliseconds timeout,
            ServiceCompletion completion) override {
    DBusClientConnection::Completion translated;
    if (completion) {
      translated = [completion = std::move(completion)](DBusClientConnection::Reply reply) {
        completion({kindOf(reply.outcome), std::move(reply.error).value_or(""), std::move(reply.results)});
      };
    }
    _connection->callNow({static_cast<std::size_t>(request.method), std::move(request.arguments),
                          std::move(request.descriptors)},
                         timeout, std::move(translated));
  }

  void finish() override { _connection->finish(); }
  void abort() override { _connection->abort(); }

 private:
  const std::shared_ptr<DBusClientConnection> _connection;
};

}  // namespace

FileDescriptor connectedSocket(const std::filesystem::path& path, std::chrono::milliseconds patience) {
  return DBusClientConnection::connectedSocket(path, patience);
}

ServiceConnector socketConnector(std::filesystem::path path, std::shared_ptr<platform::SerialQueue> queue) {
  return [path = std::move(path), queue = std::move(queue)](ServiceChannel::Events events) {
    return std::make_shared<SocketServiceChannel>(
        DBusClientConnection::connectedSocket(path, std::chrono::milliseconds::zero()), queue,
        std::move(events));
  };
}

ServiceConnector oneTimeConnector(FileDescriptor socket, std::shared_ptr<platform::SerialQueue> queue) {
  // A function must be copyable, a descriptor is not.
  const auto kept = std::make_shared<FileDescriptor>(std::move(socket));
  return [kept, queue = std::move(queue)](ServiceChannel::Events events) {
    if (!*kept) throw std::system_error(std::make_error_code(std::errc::not_connected));
    return std::make_shared<SocketServiceChannel>(std::move(*kept), queue, std::move(events));
  };
}

}  // namespace tallyd
