// The station's UDP socket.
#pragma once

#include <cstdint>
#include <memory>

#include "station/DatagramExchange.h"

namespace tallyd::station {

/// Receives datagrams on 127.0.0.1 and acknowledges them, on a thread of its own, from construction to
/// destruction. What is held back at the end is lost.
///
/// Threading: any thread.
class DatagramReceiver {
 public:
  /// Borrows the others. `port` 0 lets the system choose. Throws std::runtime_error with the address at
  /// fault.
  DatagramReceiver(int port, const BadNetwork& network, const platform::Clock& clock, Journal& journal,
                   TerminalView& view);
  ~DatagramReceiver();
  DatagramReceiver(const DatagramReceiver&) = delete;
  DatagramReceiver& operator=(const DatagramReceiver&) = delete;

  [[nodiscard]] int port() const;
  [[nodiscard]] DatagramTotals totals() const;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace tallyd::station
