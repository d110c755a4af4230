// The events that every figure is measured with.
#pragma once

#include <array>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace tallyd::bench {

/// Events of one batch, and of one flush.
inline constexpr std::size_t kBatchSize = 50;

inline constexpr unsigned kCategory = 3;
inline constexpr unsigned kType = 2;

/// What differs from event to event. Each text has the same length for every number, so that a recorded
/// message can be given another event's.
struct VariableTexts {
  std::string running;   ///< The number itself.
  std::string request;   ///< 128 bits that look like chance, as identifiers do.
  std::string title;     ///< Words that come again and again, in changing order.
  std::string referrer;  ///< The same path each time, with other numbers in it.

  [[nodiscard]] std::array<const std::string*, 4> all() const {
    return {&running, &request, &title, &referrer};
  }
};
[[nodiscard]] VariableTexts variableTexts(std::size_t number);

/// Ten fields, about 330 bytes as JSON.
[[nodiscard]] platform::Dictionary payload(std::size_t number);

/// Counts the running numbers of events that arrived.
class EventCheck {
 public:
  /// For the events 0 to `events` - 1, each of which is to arrive `copies` times.
  explicit EventCheck(std::size_t events, std::size_t copies = 1);

  /// A document, as the daemon posts it. Throws std::runtime_error when an event has come too often, when
  /// nobody sent it, and when a field that was to be hashed is not.
  void addDocument(std::string_view document);
  /// A dashboard's datagram. Throws like addDocument(). Those of the daemon's own events are let through.
  void addDatagram(std::string_view datagram);
  /// Throws std::runtime_error when an event is missing.
  void finish() const;

 private:
  void add(const char* digits);

  std::size_t _copies;
  std::vector<std::size_t> _seen;  ///< By running number.
  std::size_t _count = 0;
};

}  // namespace tallyd::bench
