// A client that speaks the wire format byte by byte, so that it can also speak it wrongly.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"
#include "platform/dbus/Message.h"

namespace tallyd::platform {

/// Little-endian D-Bus marshalling (D-Bus Specification, "Type System").
class RawBytes {
 public:
  RawBytes& align(std::size_t boundary) {
    while (_bytes.size() % boundary != 0) _bytes.push_back('\0');
    return *this;
  }
  RawBytes& byte(std::uint8_t value) {
    _bytes.push_back(static_cast<char>(value));
    return *this;
  }
  RawBytes& number(std::uint32_t value) {
    align(4);
    for (int shift = 0; shift < 32; shift += 8) byte(static_cast<std::uint8_t>(value >> shift));
    return *this;
  }
  RawBytes& text(std::string_view value) {
    number(static_cast<std::uint32_t>(value.size()));
    _bytes += value;
    return byte(0);
  }
  RawBytes& signature(std::string_view value) {
    byte(static_cast<std::uint8_t>(value.size()));
    _bytes += value;
    return byte(0);
  }
  RawBytes& raw(std::string_view value) {
    _bytes += value;
    return *this;
  }
  [[nodiscard]] const std::string& bytes() const { return _bytes; }

 private:
  std::string _bytes;
};

/// One method call of the test interface.
inline std::string rawCall(std::uint32_t serial, std::string_view member, std::string_view signature = {},
                           const std::string& body = {}) {
  RawBytes fields;
  const auto field = [&](std::uint8_t code, std::string_view type) {
    fields.align(8).byte(code).signature(type);
  };
  field(1, "o");
  fields.text("/com/example/test");
  field(2, "s");
  fields.text("com.example.Test");
  field(3, "s");
  fields.text(member);
  if (!signature.empty()) {
    field(8, "g");
    fields.signature(signature);
  }
  RawBytes message;
  message.byte('l').byte(1).byte(0).byte(1);
  message.number(static_cast<std::uint32_t>(body.size())).number(serial);
  message.number(static_cast<std::uint32_t>(fields.bytes().size())).raw(fields.bytes()).align(8).raw(body);
  return message.bytes();
}

class RawClient {
 public:
  static constexpr int kDeadlineMs = 60'000;

  explicit RawClient(const std::filesystem::path& path)
      : _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    if (::connect(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      throw std::runtime_error("cannot connect to " + path.string());
    }
  }

  static std::string authentication() {
    return std::string("\0AUTH ANONYMOUS 7465\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n", 48);
  }
  /// Authenticates, with `more` sent right behind, and waits for the answers of the authentication.
  RawClient& authenticate(const std::string& more = {}) {
    send(authentication() + more);
    return awaitAuthentication();
  }
  RawClient& awaitAuthentication() {
    std::string answer;
    while (answer.find("AGREE_UNIX_FD\r\n") == std::string::npos) {
      const auto next = receive(1);
      if (next.empty()) throw std::runtime_error("not authenticated: " + answer);
      answer += next;
    }
    return *this;
  }
  void send(std::string_view bytes) const {
    while (!bytes.empty()) {
      const auto sent = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (sent <= 0) return;  // The other side has closed; the test sees it.
      bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
  }
  /// False when nothing more is taken for `patienceMs`.
  bool trySend(std::string_view bytes, int patienceMs) const {
    while (!bytes.empty()) {
      pollfd ready{.fd = _socket.get(), .events = POLLOUT, .revents = 0};
      if (::poll(&ready, 1, patienceMs) <= 0) return false;
      const auto sent = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
      if (sent > 0) bytes.remove_prefix(static_cast<std::size_t>(sent));
      if (sent < 0 && errno != EAGAIN) return false;
    }
    return true;
  }
  /// Up to `size` bytes; empty at the end or the deadline.
  std::string receive(std::size_t size) const {
    pollfd ready{.fd = _socket.get(), .events = POLLIN, .revents = 0};
    if (::poll(&ready, 1, kDeadlineMs) <= 0) return {};
    std::string bytes(size, '\0');
    const auto received = ::recv(_socket.get(), bytes.data(), size, 0);
    bytes.resize(received > 0 ? static_cast<std::size_t>(received) : 0);
    return bytes;
  }
  /// One whole message; nothing at the end or the deadline.
  std::optional<std::string> receiveMessage() const {
    std::string message;
    std::size_t size = dbus::kFixedHeaderBytes;
    while (message.size() < size) {
      const auto more = receive(size - message.size());
      if (more.empty()) return std::nullopt;
      message += more;
      if (const auto length = dbus::messageLength(message); length > 0) size = length;
    }
    return message;
  }
  /// True when the other side closes before the deadline and sends nothing before.
  bool isClosedByPeer() const {
    pollfd ready{.fd = _socket.get(), .events = POLLIN, .revents = 0};
    char byte = 0;
    return ::poll(&ready, 1, kDeadlineMs) > 0 && ::recv(_socket.get(), &byte, 1, 0) <= 0;
  }
  void close() { _socket.reset(); }
  [[nodiscard]] int descriptor() const { return _socket.get(); }

 private:
  FileDescriptor _socket;
};

}  // namespace tallyd::platform
