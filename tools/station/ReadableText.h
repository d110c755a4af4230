// Values as lines of text that play no tricks on a terminal.
#pragma once

#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::station {

/// Bare when it is a plain word, else quoted and escaped as JSON has it.
[[nodiscard]] std::string readableText(std::string_view text);
/// The same of a value; "-" without one. What JSON has no form for appears as jsonForm() gives it.
[[nodiscard]] std::string readableValue(const platform::Value* value);

/// "2026-03-01 12:00:01.250" (UTC) of seconds since 1970; the value as it is when it is no such time.
[[nodiscard]] std::string readableTime(const platform::Value* value);

/// " KEY=VALUE" of each entry.
[[nodiscard]] std::string readableFields(const platform::Dictionary& fields);

/// A posted event in one line: time, sender, session, method, status, number, then the payload's fields.
[[nodiscard]] std::string readableEvent(const platform::Dictionary& event);

/// `text`, cut to `bytes` and an ellipsis when it is longer, and never within a character.
[[nodiscard]] std::string shortened(std::string_view text, std::size_t bytes);

/// A value that JSON can express: dates become {"date": "2026-03-01 12:00:01.250"}, data {"data": base64},
/// and numbers that are none or infinite their description.
[[nodiscard]] platform::Value jsonForm(const platform::Value& value);

/// One JSON object in one line.
[[nodiscard]] std::string recordOf(const platform::Dictionary& record);

}  // namespace tallyd::station
