// Values as JSON text (RFC 8259) and back.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::platform {

/// Compact JSON; nothing when the value holds a date, data, a NaN or an infinity. Booleans are true and
/// false; text that is not UTF-8 gets the replacement character.
[[nodiscard]] std::optional<std::string> jsonFromValue(const Value& value);

struct JSONResult {
  std::optional<Value> value;
  std::string error;  ///< What is wrong and at which byte; empty when there is a value.
};

/// Reads one JSON text. Nesting is bounded as property lists' is.
[[nodiscard]] JSONResult valueFromJSON(std::string_view text);

}  // namespace tallyd::platform
