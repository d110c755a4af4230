// The scalar elements of XML property lists, and what their text means.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::platform {

enum class XMLElement { None, List, Dictionary, Array, Key, String, Integer, Real, True, False, Date, Data };

/// The element of this name; None for any other name.
[[nodiscard]] XMLElement xmlElementNamed(std::string_view name);

/// The value of a scalar element with this text, or nothing when the text is none of its kind.
///
/// Blanks around numbers and dates don't count. Integers are decimal or, after 0x, hexadecimal, from -2^63 to
/// 2^64 - 1. Dates are "YYYY-MM-DDTHH:MM:SSZ", seconds with or without a fraction. Data is base64, other
/// characters passed over.
[[nodiscard]] std::optional<Value> xmlScalar(XMLElement element, std::string text);

}  // namespace tallyd::platform
