// A dashboard server on the loopback interface, with a port that the system chooses.
#pragma once

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// Receives datagrams, one at a time, and answers their sender. Threading: one thread at a time.
class LoopbackDashboard {
 public:
  static constexpr int kPatienceMilliseconds = 20'000;

  LoopbackDashboard() : _socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
    sockaddr_in address = loopback(0);
    EXPECT_EQ(::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    socklen_t length = sizeof address;
    EXPECT_EQ(::getsockname(_socket.get(), reinterpret_cast<sockaddr*>(&address), &length), 0);
    _port = ntohs(address.sin_port);
  }

  [[nodiscard]] std::uint16_t port() const { return _port; }
  /// Where the last datagram came from.
  [[nodiscard]] std::uint16_t senderPort() const { return ntohs(_sender.sin_port); }

  /// The next of the datagrams that were sent before this call; nothing when there is none.
  std::optional<std::string> received() {
    // What this server sends itself comes behind them.
    const std::string marker = "marker " + std::to_string(++_markers);
    send(marker, _port);
    while (true) {
      auto datagram = waitForDatagram();
      if (!datagram || *datagram == marker) return std::nullopt;
      if (!datagram->starts_with("marker ")) return datagram;
    }
  }
  /// The next datagram; nothing when none comes in time.
  std::optional<std::string> waitForDatagram() {
    pollfd readable{_socket.get(), POLLIN, 0};
    if (::poll(&readable, 1, kPatienceMilliseconds) != 1) return std::nullopt;
    char buffer[2048];
    sockaddr_in sender{};
    socklen_t length = sizeof sender;
    const ssize_t got =
        ::recvfrom(_socket.get(), buffer, sizeof buffer, 0, reinterpret_cast<sockaddr*>(&sender), &length);
    if (got < 0) return std::nullopt;
    if (ntohs(sender.sin_port) != _port) _sender = sender;
    return std::string(buffer, static_cast<std::size_t>(got));
  }

  /// To the sender of the last datagram.
  void reply(std::string_view bytes) { send(bytes, senderPort()); }
  void send(std::string_view bytes, std::uint16_t port) {
    const sockaddr_in address = loopback(port);
    EXPECT_EQ(::sendto(_socket.get(), bytes.data(), bytes.size(), 0,
                       reinterpret_cast<const sockaddr*>(&address), sizeof address),
              static_cast<ssize_t>(bytes.size()));
  }

 private:
  static sockaddr_in loopback(std::uint16_t port) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(port);
    return address;
  }

  platform::FileDescriptor _socket;
  std::uint16_t _port = 0;
  sockaddr_in _sender{};
  int _markers = 0;
};

}  // namespace tallyd::test
