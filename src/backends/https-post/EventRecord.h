// The flat record that a message becomes.
#pragma once

#include <sys/time.h>

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd {

/// What a record says beside the message's payload.
struct EventFacts {
  double sessionStart = 0;  ///< Seconds since 1970.
  std::string_view sender;
  std::uint16_t clientVersion = 0;
  std::string sessionID;
  std::uint16_t eventNumber = 0;
  std::uint16_t method = 0;
  std::uint16_t status = 0;
  double eventTime = 0;  ///< Seconds since 1970.
  std::optional<std::string> productFamily;
  std::optional<std::string> productModel;
  std::optional<std::string> osVersion;
  std::optional<std::string> build;
  bool isInternal = false;
  std::uint8_t reportVersionMajor = 0;
  std::uint8_t reportVersionMinor = 0;
  std::chrono::seconds timezoneOffset{0};
};

/// The payload with the facts set over it; a fact that is missing takes a payload field of its name away.
/// Times are shifted so that the session looks as if it had started on a whole minute.
[[nodiscard]] platform::Dictionary eventRecord(const std::optional<platform::Dictionary>& payload,
                                               const EventFacts& facts);

/// `seconds` cut toward zero to a multiple of 60.
[[nodiscard]] std::int64_t truncateToMinute(std::int64_t seconds);

}  // namespace tallyd
