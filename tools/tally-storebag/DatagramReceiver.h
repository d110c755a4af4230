// The server end of datagrams that must not leave the host.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/FileDescriptor.h"

namespace tallyd::storebagtool {

/// A UDP socket on the loopback interface, at a port of the system's choice.
class DatagramReceiver {
 public:
  static constexpr const char* kAddress = "127.0.0.1";
  static constexpr std::chrono::milliseconds kPatience{2000};  ///< A datagram on this host takes no time.

  /// Throws std::system_error.
  DatagramReceiver();

  [[nodiscard]] std::uint16_t port() const { return _port; }
  /// The next datagram; nothing when none comes within the patience.
  [[nodiscard]] std::optional<std::string> receive() const;

 private:
  platform::FileDescriptor _socket;
  std::uint16_t _port = 0;
};

}  // namespace tallyd::storebagtool
