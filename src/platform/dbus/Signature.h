// Type signatures of D-Bus (D-Bus Specification, "Type System").
#pragma once

#include <cstddef>
#include <string_view>

namespace tallyd::platform::dbus {

/// Longest signature, and deepest nesting of arrays and of structures in one.
inline constexpr std::size_t kMaximumSignatureBytes = 255;
inline constexpr int kMaximumSignatureDepth = 32;

/// The length of the first complete type of a valid signature; 0 for an empty one.
[[nodiscard]] std::size_t completeTypeLength(std::string_view signature);

[[nodiscard]] bool isValidSignature(std::string_view signature);
/// Whether it is valid and one complete type.
[[nodiscard]] bool isOneCompleteType(std::string_view signature);

/// Boundary in bytes that a value of a type with this first character starts at; 1 for what is no type.
[[nodiscard]] std::size_t alignmentOf(char type);

}  // namespace tallyd::platform::dbus
