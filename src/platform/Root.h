// The folder below which every fixed path of the daemon lies.
#pragma once

#include <filesystem>
#include <string_view>

namespace tallyd::platform {

/// `/` on a device; another folder in tests and unprivileged runs.
class Root {
 public:
  explicit Root(std::filesystem::path directory = "/") : _directory(std::move(directory)) {}

  [[nodiscard]] const std::filesystem::path& directory() const { return _directory; }

  /// The place below the root of an absolute path such as "/etc/tally".
  [[nodiscard]] std::filesystem::path under(std::string_view absolutePath) const {
    return _directory / std::filesystem::path(absolutePath).relative_path();
  }

 private:
  std::filesystem::path _directory;
};

}  // namespace tallyd::platform
