// One message as the dashboard server gets it: a binary header and a short text.
#pragma once

#include <sys/time.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/Value.h"

namespace tallyd {

/// Where each field starts. Fields of more than one byte are big-endian.
enum DatagramOffset : std::size_t {
  DatagramSelfVersion = 0,
  DatagramClientType = 1,
  DatagramConstant = 2,
  DatagramSubsecond = 3,  ///< In steps of 4 ms, so that it fits its byte.
  DatagramSeconds = 4,
  DatagramSessionID = 8,       ///< Bits inverted.
  DatagramClientVersion = 12,  ///< Bits inverted.
  DatagramLength = 14,         ///< Of the whole datagram; bits inverted.
  DatagramMethod = 16,
  DatagramRespCode = 18,
  DatagramDeviceID = 20,
  DatagramEventID = 60,
  DatagramFlags = 62,
  DatagramText = 64,
};

enum DatagramFlag : std::uint16_t {
  DatagramFlagReliable = 1,
  DatagramFlagNoProfile = 2,  ///< The server was not named by a storebag.
};

inline constexpr std::size_t kDatagramBufferBytes = 1088;
inline constexpr std::size_t kDatagramDeviceIDBytes = 40;
inline constexpr std::int32_t kDatagramSubsecondMicroseconds = 4000;

/// What a datagram says beside the message's payload.
struct DatagramFacts {
  std::uint8_t selfVersionMajor = 0;
  std::int32_t compType = 0;
  timeval timestamp{};
  std::uint32_t sessionID = 0;
  std::uint16_t clientVersion = 0;
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::string_view udid{};  ///< Its first 40 bytes are sent, zeros after a shorter one.
  std::uint16_t eventID = 0;
  bool reliableUDP = false;
  bool usingProfile = false;
};

/// A finished datagram in a buffer for the largest one. Never changes.
class Datagram {
 public:
  Datagram(const DatagramFacts& facts, const std::optional<platform::Dictionary>& payload);

  /// What goes over the wire: 64 to 1087 bytes.
  [[nodiscard]] std::string_view bytes() const { return {_buffer.data(), _length}; }
  [[nodiscard]] std::uint16_t eventID() const;

 private:
  void putHeader(const DatagramFacts& facts);

  std::array<char, kDatagramBufferBytes> _buffer{};
  std::size_t _length = DatagramText;
};

/// The big-endian numbers at `offset`, which must leave room for them.
[[nodiscard]] std::uint8_t datagramByte(std::string_view datagram, DatagramOffset offset);
[[nodiscard]] std::uint16_t datagramNumber16(std::string_view datagram, DatagramOffset offset);
[[nodiscard]] std::uint32_t datagramNumber32(std::string_view datagram, DatagramOffset offset);

/// The event ID that a received datagram acknowledges; nothing when it is too short to have one. No other
/// field of an acknowledgement means anything.
[[nodiscard]] std::optional<std::uint16_t> acknowledgedEventID(std::string_view received);

}  // namespace tallyd
