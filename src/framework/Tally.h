// What the client framework knows of itself and of the device.
#pragma once

#include <optional>
#include <string>

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// The framework's own class; its bundle is Platform::frameworkBundle.
class Tally {
 public:
  /// Borrows the platform.
  explicit Tally(const platform::Platform& platform) : _platform(platform) {}

  /// "CFBundleVersion" of the framework's bundle; nothing when the bundle has none.
  [[nodiscard]] std::optional<std::string> bundleVersion() const;

  /// The device's stable client identifier, a UUID's text: one for each value of the flag, derived from the
  /// machine ID in a way that neither leads back to it nor from one identifier to the other. Nothing on a
  /// device without a machine ID.
  [[nodiscard]] std::optional<std::string> getPersistentIdentifierForDNU(bool consented) const;

 private:
  const platform::Platform& _platform;
};

/// What stands for the framework's version when its bundle has none.
inline constexpr std::string_view kDefaultReportingVersion = "6.21";

}  // namespace tallyd
