// Values, written as arguments and results into D-Bus messages.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace tallyd::platform::dbus {

class ByteWriter;

/// Appends one value for each complete type of the signature; each "h" refers to the next descriptor of the
/// message, in place of a value's own contents. What readBody() reads comes out the same.
///
/// Texts that are no UTF-8, or hold a NUL, get replacement characters: D-Bus carries neither.
///
/// @param descriptors  how many descriptors the message has.
/// @return why that is not possible: a value does not fit its type, or is nested too deeply; what was written
/// is then of no use.
[[nodiscard]] std::optional<std::string> writeBody(ByteWriter& out, std::string_view signature,
                                                   const std::vector<Value>& values, std::size_t descriptors);

}  // namespace tallyd::platform::dbus
