#include "support/DeviceIdentity.h"

#include <algorithm>

#include "platform/Platform.h"
#include "platform/Randomness.h"
#include "platform/Settings.h"

namespace tallyd {

using platform::Platform;

std::optional<std::string> deviceProductVersion(const Platform& platform) {
  return platform.device.GNCopyAnswer("ProductVersion");
}
std::optional<std::string> deviceBuildVersion(const Platform& platform) {
  return platform.device.GNCopyAnswer("BuildVersion");
}
std::optional<std::string> deviceProductType(const Platform& platform) {
  return platform.device.GNCopyAnswer("ProductType");
}
std::optional<std::string> deviceName(const Platform& platform) {
  return platform.device.GNCopyAnswer("DeviceName");
}
std::optional<std::string> deviceHardwareModel(const Platform& platform) {
  return platform.device.GNCopyAnswer("HWModelStr");
}
std::optional<std::string> deviceSerialNumber(const Platform& platform) {
  return platform.device.GNCopyAnswer("SerialNumber");
}

void copyUniqueDeviceID(const Platform& platform, DeviceIDBuffer& buffer) {
  const auto answer = platform.device.GNCopyAnswer("UniqueDeviceID");
  if (!answer || answer->size() >= buffer.size()) return;
  *std::copy(answer->begin(), answer->end(), buffer.begin()) = '\0';
  buffer.back() = '\0';
}

bool isInternalBuild(const Platform& platform) {
  return platform.process.internalBuild.get(
      [&] { return platform.device.GNCopyAnswer("ReleaseType") == "Internal"; });
}

const std::string& processInstanceUUIDString(const Platform& platform) {
  return platform.process.instanceUUID.get([&] { return platform::uuidText(platform.randomness.uuid()); });
}

}  // namespace tallyd
