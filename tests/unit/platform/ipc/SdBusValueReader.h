// What an independent implementation of D-Bus finds in a message, as values.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "SdBusHandles.h"
#include "platform/dbus/BodyReader.h"

namespace tallyd::platform {

/// As dbus::readBody(), by sd-bus.
[[nodiscard]] dbus::ReadValues readValues(sd_bus_message* message, std::string_view signature);

}  // namespace tallyd::platform
