// Property lists as bytes: XML, binary and the old ASCII form.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::platform {

enum class PropertyListFormat { XML, Binary };

/// A parsed list, or why there is none.
struct PropertyListResult {
  std::optional<Value> value;
  std::string error;  ///< Empty when there is a value.
};

/// Deepest nesting that is read and written; what lies deeper is an error.
inline constexpr int kMaximumPropertyListDepth = kMaximumValueDepth;

/// Reads any of the three forms, with any value at the top. Never throws; hostile input costs time and memory
/// in proportion to its size.
///
/// Strings and keys come out as UTF-8, with U+FFFD for what is none; a binary list whose keys hold a NUL is
/// refused. Integers are signed, save those that only 64 unsigned bits hold; larger ones are an error. Object
/// references of archives read as
/// {"CF$UID": number}. A binary list's dates are exact to the microsecond, those outside 1933-2069 to the
/// second.
[[nodiscard]] PropertyListResult propertyListWithData(std::string_view bytes);

/// Writes `value`; nothing when it holds what can't be expressed: null, nesting deeper than
/// kMaximumPropertyListDepth, a date outside the years 1 to 9999, or more than a gigabyte. In strings, NUL
/// and what is no UTF-8 become U+FFFD; in XML so do the characters that XML excludes, and dates lose their
/// fraction of a second.
[[nodiscard]] std::optional<std::string> dataWithPropertyList(const Value& value, PropertyListFormat format);

}  // namespace tallyd::platform
