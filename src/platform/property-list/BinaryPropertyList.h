// Binary property lists.
#pragma once

#include <string_view>

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

/// What a binary property list begins with, before its version.
inline constexpr std::string_view kBinaryPropertyListStart = "bplist";

/// Reads a list of at most kMaximumPropertyListBytes.
[[nodiscard]] PropertyListResult propertyListWithBinary(std::string_view bytes);

}  // namespace tallyd::platform
