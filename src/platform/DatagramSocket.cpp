#include "platform/DatagramSocket.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

namespace {

const sockaddr* generic(const sockaddr_in& address) { return reinterpret_cast<const sockaddr*>(&address); }

class UDPSocket final : public DatagramSocket {
 public:
  explicit UDPSocket(FileDescriptor descriptor) : _descriptor(std::move(descriptor)) {}

  [[nodiscard]] int bindToAnyPort() override {
    sockaddr_in anyPort{};
    anyPort.sin_family = AF_INET;
    anyPort.sin_addr.s_addr = htonl(INADDR_ANY);
    return ::bind(_descriptor.get(), generic(anyPort), sizeof anyPort) == 0 ? 0 : errno;
  }
  [[nodiscard]] int connect(const sockaddr_in& server) override {
    return ::connect(_descriptor.get(), generic(server), sizeof server) == 0 ? 0 : errno;
  }
  [[nodiscard]] bool send(std::string_view bytes) override {
    const ssize_t sent = ::send(_descriptor.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    return sent == static_cast<ssize_t>(bytes.size());
  }
  [[nodiscard]] std::size_t receive(std::span<char> buffer) override {
    const ssize_t length = ::recv(_descriptor.get(), buffer.data(), buffer.size(), 0);
    return static_cast<std::size_t>(std::max<ssize_t>(length, 0));
  }
  [[nodiscard]] int descriptor() const override { return _descriptor.get(); }

 private:
  FileDescriptor _descriptor;
};

class SystemDatagramSockets final : public DatagramSockets {
 public:
  [[nodiscard]] std::unique_ptr<DatagramSocket> makeSocket() override {
    FileDescriptor descriptor(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, IPPROTO_UDP));
    return descriptor ? std::make_unique<UDPSocket>(std::move(descriptor)) : nullptr;
  }
};

}  // namespace

DatagramSockets& systemDatagramSockets() {
  static SystemDatagramSockets sockets;
  return sockets;
}

}  // namespace tallyd::platform
