// A payload as the short text that a datagram carries.
#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd {

/// Writes one item for each entry, a space, the key, an equals sign and the value, into `area`, until it is
/// full: what runs past its end is cut off, even within a letter. Shortest descriptions (in UTF-16 units)
/// first, so that a full area loses as few items as it can; of equal length in the order of the keys. Text
/// that holds a NUL ends there. Keys stand as they are.
///
/// Returns the bytes written. Costs time in proportion to the payload's size, whatever the area holds of it.
[[nodiscard]] std::size_t writePayloadText(const platform::Dictionary& payload, std::span<char> area);

/// Text of a string or a number; "null" for everything else.
[[nodiscard]] std::string descriptionForObject(const platform::Value& object);

/// `text` without line feeds, each backslash doubled and each equals sign behind a backslash; "empty" for
/// nothing.
[[nodiscard]] std::string sanitize(std::string_view text);

}  // namespace tallyd
