// What the system's settings answer: preferences, the daemon's own defaults, device properties, bundles.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Randomness.h"
#include "platform/Value.h"

namespace tallyd::platform {

/// Preference suites, written by others and read here. Threading: any thread.
class Preferences {
 public:
  virtual ~Preferences() = default;
  /// The value under `key` in the suite as it stands now; nothing when suite or key is missing or can't be
  /// read.
  [[nodiscard]] virtual std::optional<Value> value(std::string_view suite, std::string_view key) const = 0;
};

/// The daemon's standard user defaults: small values that survive restarts. Threading: any thread.
class UserDefaults {
 public:
  virtual ~UserDefaults() = default;
  [[nodiscard]] virtual std::optional<Value> value(std::string_view key) const = 0;
  /// Stores the value, or removes the key; touches the disk only when something changes.
  virtual void setValue(std::string_view key, std::optional<Value> value) = 0;
};

/// Facts about the device. Threading: any thread.
class DeviceProperties {
 public:
  virtual ~DeviceProperties() = default;
  /// The answer to a question key such as "ProductVersion", asked anew at each call; nothing when there is
  /// none.
  [[nodiscard]] virtual std::optional<std::string> GNCopyAnswer(std::string_view question) const = 0;

  /// 16 bytes that are the same at each call on this machine and say nothing of another purpose's: an HMAC of
  /// the machine ID, made a UUID. Nothing on a machine without an ID.
  [[nodiscard]] virtual std::optional<UUIDBytes> machineIdentifier(std::string_view purpose) const = 0;
};

/// A folder with an information dictionary and resources. Threading: any thread.
class Bundle {
 public:
  virtual ~Bundle() = default;
  /// The value under `key` of the information dictionary; nothing when bundle or key is missing.
  [[nodiscard]] virtual std::optional<Value> infoValue(std::string_view key) const = 0;
  /// The bytes of the resource NAME.TYPE; nothing when it is missing.
  [[nodiscard]] virtual std::optional<Data> resource(std::string_view name, std::string_view type) const = 0;
};

}  // namespace tallyd::platform
