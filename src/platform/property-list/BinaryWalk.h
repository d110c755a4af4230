// What stands between a foreign binary property list and the library that reads it.
#pragma once

#include <string>
#include <string_view>

namespace tallyd::platform {

/// Walks every object that the list's root reaches, without recursion and in time proportional to the list's
/// size, and tells what is wrong with the list; empty when the library may read it. Refused are objects
/// outside the list or over one another, unknown kinds, keys that are no string or hold a NUL, cycles,
/// nesting deeper than kMaximumPropertyListDepth, and shared objects that would take up far more than the
/// list itself (kMaximumExpansion).
[[nodiscard]] std::string binaryPropertyListFault(std::string_view bytes);

}  // namespace tallyd::platform
