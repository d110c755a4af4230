// The old ASCII property lists: { key = value; }, ( a, b ), "text", bare-text, <68 65 78>, with comments.
#pragma once

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

/// Reads one value of the old ASCII form. All scalars are strings, save data. Bytes that are not UTF-8 become
/// U+FFFD.
[[nodiscard]] PropertyListResult propertyListWithASCII(std::string_view text);

}  // namespace tallyd::platform
