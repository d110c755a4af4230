// A datagram that waits to be sent or to be acknowledged.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd {

enum PacketState : int {
  PacketStateNotSent = 0,
  PacketStateWaiting = 1,  ///< Sent; its acknowledgement has not come.
};

/// The counters start at 0. Threading: one thread at a time.
class UDPPacketToSend {
 public:
  /// Copies the bytes.
  UDPPacketToSend(std::string_view bytes, std::uint16_t eventNum)
      : _eventNumber(eventNum), _data(std::string(bytes)) {}

  [[nodiscard]] int state() const { return _state; }
  void setState(int state) { _state = state; }
  /// Ticks since the last transmission.
  [[nodiscard]] int numberOfChecks() const { return _numberOfChecks; }
  void setNumberOfChecks(int count) { _numberOfChecks = count; }
  [[nodiscard]] int numberOfRetransmits() const { return _numberOfRetransmits; }
  void setNumberOfRetransmits(int count) { _numberOfRetransmits = count; }
  [[nodiscard]] std::uint16_t eventNumber() const { return _eventNumber; }
  void setEventNumber(std::uint16_t eventNumber) { _eventNumber = eventNumber; }
  [[nodiscard]] const platform::Data& data() const { return _data; }
  void setData(platform::Data data) { _data = std::move(data); }

 private:
  int _state = PacketStateNotSent;
  int _numberOfChecks = 0;
  int _numberOfRetransmits = 0;
  std::uint16_t _eventNumber;
  platform::Data _data;
};

}  // namespace tallyd
