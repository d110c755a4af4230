// Arguments and results in D-Bus messages, read as values.
#pragma once

#include <bit>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd::platform::dbus {

/// Containers nested deeper than this are refused, variants counted: other implementations refuse them too,
/// and the stack is safe.
inline constexpr int kMaximumContainerDepth = 128;
/// A message that holds more single values is refused: two bytes on the wire may cost many times that in
/// memory.
inline constexpr std::size_t kMaximumValuesInMessage = 4'000'000;

struct ReadValues {
  std::vector<Value> values;  ///< One for each complete type.
  std::vector<FileDescriptor> descriptors;
  std::optional<std::string> problem;  ///< Why the message cannot be read; the rest is then of no use.
};

/// Reads a message's body, which must have this signature.
///
/// Integers of every width become integers, "ay" data, the structure "(d)" a date, the empty signature null,
/// "a{sX}" a dictionary and any other array an array; a variant is what it holds. Descriptors are read where
/// the signature itself has them (their value is null), never within a variant. Nothing else has a value.
///
/// @param descriptors  what came with the message; those that the body refers to are moved out.
[[nodiscard]] ReadValues readBody(std::string_view body, std::endian order, std::string_view signature,
                                  std::vector<FileDescriptor> descriptors);

}  // namespace tallyd::platform::dbus
