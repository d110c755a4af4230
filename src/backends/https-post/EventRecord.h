// The flat record that a message becomes.
#pragma once

#include <sys/time.h>

#include <array>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/https-post/EventFields.h"
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

/// The record of one message. It shares its payload with whoever else has it, and what the records of a
/// session have in common with those.
class EventRecord {
 public:
  /// The payload with the facts set over it; a fact that is missing takes a payload field of its name away.
  /// What `fields` held before is gone; they refer to this record and keep what they must.
  void fieldsInto(EventFields& fields) const;
  void setSessionID(platform::Value sessionID) { _sessionID = std::move(sessionID); }

 private:
  friend class EventRecords;
  struct Common;

  platform::Dictionary _payload;
  std::shared_ptr<const Common> _common;
  platform::Value _sessionID;
  platform::Value _timezoneOffset;
  double _clientTime = 0;
  std::uint16_t _eventNumber = 0;
  std::uint16_t _method = 0;
  std::uint16_t _status = 0;
};

/// Makes the records of one session. What they have in common is prepared once, and anew when it changes.
///
/// Threading: one thread at a time.
class EventRecords {
 public:
  EventRecords() = default;
  EventRecords(const EventRecords&) = delete;
  EventRecords& operator=(const EventRecords&) = delete;

  /// Times are shifted so that the session looks as if it had started on a whole minute.
  [[nodiscard]] EventRecord record(const std::optional<platform::Dictionary>& payload,
                                   const EventFacts& facts);

 private:
  void prepare(const EventFacts& facts);
  void remember(const EventFacts& facts);

  std::array<std::string, 5> _texts;    ///< What _prepared refers to.
  std::optional<EventFacts> _prepared;  ///< The facts that _common was made of.
  std::shared_ptr<const EventRecord::Common> _common;
  platform::Value _sessionID;
  double _startMinute = 0;
};

/// `seconds` cut toward zero to a multiple of 60.
[[nodiscard]] std::int64_t truncateToMinute(std::int64_t seconds);

}  // namespace tallyd
