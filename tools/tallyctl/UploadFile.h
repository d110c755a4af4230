// A file that is to be uploaded.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>

namespace tallyd::tallyctl {

/// What the daemon can upload: a regular file that is not empty and that this user may read.
struct UploadFile {
  std::filesystem::path path;  ///< Absolute.
  std::uint64_t bytes = 0;

  /// Looks at the file, before the daemon is asked. Throws Failure or std::system_error that names it and
  /// what it is instead.
  [[nodiscard]] static UploadFile find(const std::string& name);
};

}  // namespace tallyd::tallyctl
