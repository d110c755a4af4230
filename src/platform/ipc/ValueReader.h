// Arguments and results of D-Bus messages, read as values.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"
#include "platform/ipc/BusHandles.h"

namespace tallyd::platform {

/// Containers nested deeper than this are refused, variants counted: sd-bus, on the other side of most
/// sockets, refuses them too, and the stack is safe.
inline constexpr int kMaximumContainerDepth = 128;
/// A message that holds more single values is refused: two bytes on the wire may cost many times that in
/// memory.
inline constexpr std::size_t kMaximumValuesInMessage = 4'000'000;

/// The length of the first complete type of a valid signature; 0 for an empty one.
[[nodiscard]] std::size_t completeTypeLength(std::string_view signature);

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
[[nodiscard]] ReadValues readValues(sd_bus_message* message, std::string_view signature);

}  // namespace tallyd::platform
