// Values, written into D-Bus messages.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"
#include "platform/ipc/BusHandles.h"

namespace tallyd::platform {

/// Appends one value for each complete type of the signature; "h" takes the next descriptor in place of a
/// value's own contents (the message gets a copy). What readValues() reads comes out the same.
///
/// Texts that are no UTF-8, or hold a NUL, get replacement characters: D-Bus carries neither.
///
/// @return why that is not possible: a value does not fit its type, or is nested too deeply.
[[nodiscard]] std::optional<std::string> appendValues(sd_bus_message* message, std::string_view signature,
                                                      const std::vector<Value>& values,
                                                      const std::vector<FileDescriptor>& descriptors);

}  // namespace tallyd::platform
