#include "backends/dashboard/Datagram.h"

#include <type_traits>

#include "backends/dashboard/PayloadText.h"

namespace tallyd {

namespace {

constexpr unsigned kBitsPerByte = 8;

template <class Number>
void putNumber(char* place, std::type_identity_t<Number> number) {
  for (std::size_t i = sizeof(Number); i-- > 0;) {
    place[i] = static_cast<char>(number & 0xFFU);
    if constexpr (sizeof(Number) > 1) number = static_cast<Number>(number >> kBitsPerByte);
  }
}

template <class Number>
Number numberAt(std::string_view datagram, std::size_t offset) {
  std::uint32_t number = 0;
  for (const char byte : datagram.substr(offset, sizeof(Number))) {
    number = number << kBitsPerByte | static_cast<std::uint8_t>(byte);
  }
  return static_cast<Number>(number);
}

}  // namespace

Datagram::Datagram(const DatagramFacts& facts, const std::optional<platform::Dictionary>& payload) {
  putHeader(facts);
  // The last byte of the buffer stays zero: whoever reads the text from the buffer finds its end.
  const std::span area(_buffer.data() + DatagramText, _buffer.size() - DatagramText - 1);
  if (payload) _length += writePayloadText(*payload, area);
  putNumber<std::uint16_t>(_buffer.data() + DatagramLength, static_cast<std::uint16_t>(~_length));
}

void Datagram::putHeader(const DatagramFacts& facts) {
  const auto put8 = [this](DatagramOffset offset, auto number) {
    putNumber<std::uint8_t>(_buffer.data() + offset, static_cast<std::uint8_t>(number));
  };
  const auto put16 = [this](DatagramOffset offset, auto number) {
    putNumber<std::uint16_t>(_buffer.data() + offset, static_cast<std::uint16_t>(number));
  };
  const auto put32 = [this](DatagramOffset offset, auto number) {
    putNumber<std::uint32_t>(_buffer.data() + offset, static_cast<std::uint32_t>(number));
  };
  put8(DatagramSelfVersion, facts.selfVersionMajor);
  put8(DatagramClientType, facts.compType);
  put8(DatagramConstant, 1);
  put8(DatagramSubsecond, facts.timestamp.tv_usec / kDatagramSubsecondMicroseconds);
  put32(DatagramSeconds, facts.timestamp.tv_sec);
  put32(DatagramSessionID, ~facts.sessionID);
  put16(DatagramClientVersion, ~facts.clientVersion);
  put16(DatagramMethod, facts.method);
  put16(DatagramRespCode, facts.respCode);
  facts.udid.copy(_buffer.data() + DatagramDeviceID, kDatagramDeviceIDBytes);
  put16(DatagramEventID, facts.eventID);
  put16(DatagramFlags,
        (facts.reliableUDP ? DatagramFlagReliable : 0) | (facts.usingProfile ? 0 : DatagramFlagNoProfile));
}

std::uint16_t Datagram::eventID() const { return datagramNumber16(bytes(), DatagramEventID); }

std::uint8_t datagramByte(std::string_view datagram, DatagramOffset offset) {
  return numberAt<std::uint8_t>(datagram, offset);
}

std::uint16_t datagramNumber16(std::string_view datagram, DatagramOffset offset) {
  return numberAt<std::uint16_t>(datagram, offset);
}

std::uint32_t datagramNumber32(std::string_view datagram, DatagramOffset offset) {
  return numberAt<std::uint32_t>(datagram, offset);
}

std::optional<std::uint16_t> acknowledgedEventID(std::string_view received) {
  if (received.size() < DatagramEventID + sizeof(std::uint16_t)) return std::nullopt;
  return datagramNumber16(received, DatagramEventID);
}

}  // namespace tallyd
