// The flat record that a message becomes.
#pragma once

#include <sys/time.h>

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace tallyd {

/// What a record says beside the message's payload. Texts are borrowed for the one call.
struct EventFacts {
  double sessionStart = 0;  ///< Seconds since 1970.
  std::string_view sender;
  std::uint16_t clientVersion = 0;
  std::string_view sessionID;
  std::uint16_t eventNumber = 0;
  std::uint16_t method = 0;
  std::uint16_t status = 0;
  double eventTime = 0;  ///< Seconds since 1970.
  std::optional<std::string_view> productFamily;
  std::optional<std::string_view> productModel;
  std::optional<std::string_view> osVersion;
  std::optional<std::string_view> build;
  bool isInternal = false;
  std::uint8_t reportVersionMajor = 0;
  std::uint8_t reportVersionMinor = 0;
  std::chrono::seconds timezoneOffset{0};
};

/// Makes the records of one session. What they have in common is prepared once, and anew when it changes.
///
/// Threading: one thread at a time.
class EventRecords {
 public:
  EventRecords() = default;
  EventRecords(const EventRecords&) = delete;
  EventRecords& operator=(const EventRecords&) = delete;

  /// The payload with the facts set over it; a fact that is missing takes a payload field of its name away.
  /// Times are shifted so that the session looks as if it had started on a whole minute.
  [[nodiscard]] platform::Dictionary record(const std::optional<platform::Dictionary>& payload,
                                            const EventFacts& facts);

 private:
  /// Where the entries lie that differ from event to event.
  struct Places {
    std::size_t clientTime, eventNumber, method, status, timezoneOffset, eventTime;
  };

  void prepare(const EventFacts& facts);
  void remember(const EventFacts& facts);

  std::array<std::string, 6> _texts;                 ///< What _prepared refers to.
  std::optional<EventFacts> _prepared;               ///< The facts that _common was made of.
  std::vector<platform::Dictionary::Entry> _common;  ///< Of all records, in the order of their keys.
  std::vector<std::string_view> _missing;            ///< Keys of the facts that are missing.
  double _startMinute = 0;
  Places _places{};
};

/// `seconds` cut toward zero to a multiple of 60.
[[nodiscard]] std::int64_t truncateToMinute(std::int64_t seconds);

}  // namespace tallyd
