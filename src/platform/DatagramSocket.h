// Datagrams to one server, and what it answers.
#pragma once

#include <netinet/in.h>

#include <cstddef>
#include <memory>
#include <span>
#include <string_view>

namespace tallyd::platform {

/// A UDP socket over IPv4; closed with this object. No call blocks. Threading: one thread at a time.
class DatagramSocket {
 public:
  virtual ~DatagramSocket() = default;

  /// Takes a port of the system's choice on every address. Zero, or errno's number.
  [[nodiscard]] virtual int bindToAnyPort() = 0;
  /// Names the server: where datagrams go, and the only one to hear from. Zero, or errno's number.
  [[nodiscard]] virtual int connect(const sockaddr_in& server) = 0;
  /// Whether the network took the whole datagram.
  [[nodiscard]] virtual bool send(std::string_view bytes) = 0;
  /// The bytes of one datagram that has arrived, cut to the buffer; 0 without one.
  [[nodiscard]] virtual std::size_t receive(std::span<char> buffer) = 0;
  /// What a read source watches. Valid as long as this object.
  [[nodiscard]] virtual int descriptor() const = 0;
};

/// Threading: any thread.
class DatagramSockets {
 public:
  virtual ~DatagramSockets() = default;
  /// Null, and errno, when there can be no more sockets.
  [[nodiscard]] virtual std::unique_ptr<DatagramSocket> makeSocket() = 0;
};

/// The system's own sockets. Holds no state.
[[nodiscard]] DatagramSockets& systemDatagramSockets();

}  // namespace tallyd::platform
