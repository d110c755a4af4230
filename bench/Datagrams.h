// A UDP socket on the loopback interface, in a dashboard server's place.
#pragma once

#include <cstddef>
#include <cstdint>

#include "Events.h"
#include "platform/FileDescriptor.h"

namespace tallyd::bench {

/// Takes datagrams and answers none. Threading: one thread at a time.
class DatagramReceiver {
 public:
  /// So many datagrams find room in the socket, whatever the system's limits of buffers are.
  static constexpr std::size_t kWindow = 100;

  DatagramReceiver();

  [[nodiscard]] std::uint16_t port() const { return _port; }
  /// Returns when `count` more have come. Throws std::runtime_error when none has come for long, and as
  /// EventCheck does.
  void receive(std::size_t count, EventCheck& check) const;

 private:
  platform::FileDescriptor _socket;
  std::uint16_t _port = 0;
};

/// Processor seconds that sending costs one thread which does nothing else: `count` datagrams of 300 bytes,
/// about what the daemon's have, to such a receiver.
[[nodiscard]] double sendingProcessorSeconds(std::size_t count);

}  // namespace tallyd::bench
