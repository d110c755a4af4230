// Who this device is: the facts that every report carries.
#pragma once

#include <array>
#include <optional>
#include <string>

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// A unique device ID of 40 characters and its terminating zero; all zero without an ID.
using DeviceIDBuffer = std::array<char, 41>;

// Each asks the platform anew and gives nothing when the device has no answer. Threading: any thread.
[[nodiscard]] std::optional<std::string> deviceProductVersion(const platform::Platform& platform);
[[nodiscard]] std::optional<std::string> deviceBuildVersion(const platform::Platform& platform);
[[nodiscard]] std::optional<std::string> deviceProductType(const platform::Platform& platform);
[[nodiscard]] std::optional<std::string> deviceName(const platform::Platform& platform);
[[nodiscard]] std::optional<std::string> deviceHardwareModel(const platform::Platform& platform);
[[nodiscard]] std::optional<std::string> deviceSerialNumber(const platform::Platform& platform);

/// Writes the unique device ID into `buffer`, terminated. Leaves the buffer as it is when the device has no
/// ID or when the ID does not fit.
void copyUniqueDeviceID(const platform::Platform& platform, DeviceIDBuffer& buffer);

/// Whether the device runs an internal build; decided at the first call and kept for the life of the process.
[[nodiscard]] bool isInternalBuild(const platform::Platform& platform);

/// A random UUID's text, the same for the life of the process.
[[nodiscard]] const std::string& processInstanceUUIDString(const platform::Platform& platform);

}  // namespace tallyd
