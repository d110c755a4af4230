// Facts about this device from its configuration and its system.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "platform/Log.h"
#include "platform/Root.h"
#include "platform/Settings.h"
#include "platform/settings/MachineFacts.h"

namespace tallyd::platform {

class PropertyListFile;

/// Answers every question from etc/tally/device.plist below the root (question key to string; read afresh
/// when it changed), and what that does not answer from the system:
///
/// | question | answer |
/// |---|---|
/// | UniqueDeviceID | 40 lower-case hex digits, an HMAC of the machine ID |
/// | ProductVersion | os-release, VERSION_ID |
/// | BuildVersion | os-release, BUILD_ID; else the kernel's release |
/// | ProductType | DMI product name, else the device tree's first "compatible" |
/// | HWModelStr | DMI board name, else the device tree's "model" |
/// | SerialNumber | DMI product serial, else the device tree's "serial-number" |
/// | DeviceName | the kind of chassis, as in "laptop" |
///
/// Kept are device.plist's contents and, since a machine's ID never changes while it runs, the identifiers
/// that were derived from it, one for each purpose. Threading: any thread; each question blocks on the disk.
class SystemDeviceProperties : public DeviceProperties {
 public:
  /// Borrows `log`. The system's own files are read below `systemRoot`. Touches no file.
  SystemDeviceProperties(const Root& root, Log& log, std::filesystem::path systemRoot = "/");
  ~SystemDeviceProperties() override;

  [[nodiscard]] std::optional<std::string> GNCopyAnswer(std::string_view question) const override;
  /// The first 16 bytes of HMAC-SHA256 (RFC 2104), keyed with the machine ID, of `purpose`; with the version
  /// (4) and variant bits of a UUID.
  [[nodiscard]] std::optional<UUIDBytes> machineIdentifier(std::string_view purpose) const override;

 private:
  [[nodiscard]] std::optional<std::string> systemAnswer(std::string_view question) const;
  [[nodiscard]] std::optional<std::string> uniqueDeviceID() const;

  const MachineFacts _machine;
  const std::unique_ptr<PropertyListFile> _configured;
  mutable std::mutex _identifiersMutex;
  mutable std::map<std::string, UUIDBytes, std::less<>> _identifiers;  ///< By purpose.
};

}  // namespace tallyd::platform
