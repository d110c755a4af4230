// Files that the tool reads and makes.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>
#include <string_view>

namespace tallyd::storebagtool {

/// Stands for the standard input or output where a file is asked for.
inline constexpr std::string_view kStandardStream = "-";

enum class Existing {
  Keep,     ///< A file that is there already is an error.
  Replace,  ///< Its place is taken, in one step.
};

/// The bytes of a file, or of the standard input; throws std::system_error that names it.
[[nodiscard]] std::string readFile(const std::filesystem::path& path);

/// Makes a file with these bytes and this mode, whatever the umask; throws std::system_error that names it,
/// and then leaves no part of it behind.
void writeFile(const std::filesystem::path& path, std::string_view bytes, mode_t mode, Existing existing);

/// A folder of the tool's own, gone with this object.
class TemporaryFolder {
 public:
  TemporaryFolder();
  ~TemporaryFolder();
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;

  [[nodiscard]] const std::filesystem::path& path() const { return _path; }

 private:
  std::filesystem::path _path;
};

}  // namespace tallyd::storebagtool
