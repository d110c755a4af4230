// A dashboard datagram as its receiver reads it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::station {

/// What the 64-byte header and the text behind it say, complements and byte order undone.
struct ReceivedDatagram {
  std::uint8_t selfVersion = 0;
  std::uint8_t clientType = 0;
  double sentTime = 0;  ///< Seconds since 1970, in steps of 4 ms.
  std::uint32_t session = 0;
  std::uint16_t clientVersion = 0;
  std::uint16_t method = 0;
  std::uint16_t status = 0;
  std::string device;  ///< Up to 40 bytes.
  std::uint16_t eventNumber = 0;
  bool isReliable = false;    ///< It comes again until it is acknowledged.
  bool hasNoProfile = false;  ///< No storebag named this server.
  std::string text;
};

struct DatagramResult {
  std::optional<ReceivedDatagram> datagram;
  std::string problem;  ///< What is wrong; empty when there is a datagram.
};

/// Decodes a datagram; refuses one that is shorter than its header, not of this layout, or not as long as it
/// says.
[[nodiscard]] DatagramResult decodeDatagram(std::string_view bytes);

/// What sets a datagram apart from all others of one sender, and makes its repetitions one with it: its
/// header, with the session, the event's number and its time. The bytes must decode.
[[nodiscard]] std::string_view datagramHeader(std::string_view bytes);

/// The answer to a reliable datagram, which must decode: its header, sent back.
[[nodiscard]] std::string_view acknowledgementOf(std::string_view bytes);

/// The text's items, " KEY=VALUE" each, with the values' escapes (a backslash before a backslash or an equals
/// sign) undone. A key runs from the last blank before its equals sign: one that holds blanks loses what is
/// before them to the value in front of it, for the text does not tell them apart.
[[nodiscard]] platform::Dictionary fieldsOfText(std::string_view text);

/// Whether the text has the greatest length, so that its last item, or more, may be missing.
[[nodiscard]] bool mayBeCut(std::string_view text);

/// The sender's short name for a client type; the number for one that has none.
[[nodiscard]] std::string senderNamed(std::uint8_t clientType);

}  // namespace tallyd::station
