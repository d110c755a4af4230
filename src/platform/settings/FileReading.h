// Whole small files as bytes.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace tallyd::platform {

/// Largest settings file or resource that is read; far above any real one, and small enough for memory.
inline constexpr std::size_t kMaximumSettingsFileBytes = 16 << 20;

/// A file's bytes, or why there are none.
struct FileContents {
  std::optional<std::string> bytes;
  int errorNumber = 0;      ///< errno of a failed system call; 0 for other reasons.
  std::string error;        ///< Empty when there are bytes.
  struct ::stat status {};  ///< Of the file that was opened; all zero when none was.
};

/// Reads a regular file of up to `maximumBytes`. Blocks on the disk, never on a pipe or device.
[[nodiscard]] FileContents readFile(const std::filesystem::path& path,
                                    std::size_t maximumBytes = kMaximumSettingsFileBytes);

/// Whether `name` is one component of a path that names a file in its folder, and nothing else.
[[nodiscard]] bool isPlainFileName(std::string_view name);

}  // namespace tallyd::platform
