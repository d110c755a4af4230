// One record of the feed as the web page shows it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "station/Feed.h"

namespace tallyd::station {

/// Of one record, so that a large one can't make the page slow.
inline constexpr std::size_t kShownFields = 100;
inline constexpr std::size_t kShownFieldBytes = 400;

/// What the records of all kinds have in common; what a record does not have is empty.
struct PageRecord {
  std::uint64_t number = 0;  ///< The feed's.
  Feed::Kind kind = Feed::Kind::Event;
  std::string session;  ///< Its own ID: the last part of a combined one.
  std::string parent;   ///< The part before that.
  std::string sender;
  std::string client;   ///< Names out of the user info.
  std::string device;   ///< Of whatever the record tells devices apart by.
  std::string started;  ///< When the session did.
  std::optional<std::uint16_t> eventNumber;
  std::uint64_t bytes = 0;  ///< Of a file.
  bool isLost = false;      ///< On purpose.
  bool isRetried = false;   ///< It had come, and been lost, before.
  /// {"n", "kind", "session", "time", "sender", "method", "status", "number", "fields", "facts", "omitted",
  /// "lost", "retried", "repeated", "name", "bytes", "link"} in one line, what the record does not have left
  /// out. Values that are too long are cut.
  std::string json;
};

[[nodiscard]] PageRecord pageRecordOf(const Feed::Entry& entry);

/// Where the page gets an uploaded file that the station keeps as `name`.
[[nodiscard]] std::string uploadLink(std::string_view name);

}  // namespace tallyd::station
