// What the machine's own files say about it.
#pragma once

#include <array>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace tallyd::platform {

using MachineID = std::array<std::uint8_t, 16>;

/// Reads below `root`, which is "/" on a device, anew at each call. Threading: any thread; blocks on the
/// disk.
class MachineFacts {
 public:
  explicit MachineFacts(std::filesystem::path root) : _root(std::move(root)) {}

  /// etc/machine-id (machine-id(5)); nothing when it is missing, empty, malformed or all zero.
  [[nodiscard]] std::optional<MachineID> machineID() const;

  /// A variable of etc/os-release, else of usr/lib/os-release (os-release(5)); nothing when missing or empty.
  [[nodiscard]] std::optional<std::string> osRelease(std::string_view variable) const;

  /// A field of sys/class/dmi/id; nothing when missing, empty or one of the texts that makers leave in
  /// unfilled fields.
  [[nodiscard]] std::optional<std::string> dmi(std::string_view field) const;

  /// A property of the device tree, of a list the first text; nothing when missing or empty.
  [[nodiscard]] std::optional<std::string> deviceTree(std::string_view property) const;

  /// "desktop", "laptop", "server", "tablet", "handset", "convertible", "vm" and so on: CHASSIS of
  /// etc/machine-info (machine-info(5)), else the device tree's "chassis-type", else DMI's kind of enclosure
  /// (SMBIOS reference specification, section 7.4.1).
  [[nodiscard]] std::optional<std::string> chassis() const;

 private:
  [[nodiscard]] std::optional<std::string> text(std::string_view relativePath) const;

  const std::filesystem::path _root;
};

/// The value of `variable` in `text`, lines of shell-like assignments; quotes and backslashes are resolved.
[[nodiscard]] std::optional<std::string> shellVariable(std::string_view text, std::string_view variable);

}  // namespace tallyd::platform
