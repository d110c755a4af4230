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

/// Counts the running numbers in JSON documents that the collector received: throws std::runtime_error unless
/// each from 0 to `events` - 1 is there just once.
void checkEvents(const std::vector<std::string>& documents, std::size_t events);

}  // namespace tallyd::bench
