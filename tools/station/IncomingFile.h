// A file that is being received, kept under its name only when it is whole.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"

namespace tallyd::station {

/// Writes to a nameless-looking file in the folder; what is not kept goes with this object.
///
/// Threading: one thread.
class IncomingFile {
 public:
  /// Makes the folder when it is missing. Throws std::system_error that names the path at fault.
  explicit IncomingFile(std::filesystem::path folder);
  ~IncomingFile();
  IncomingFile(const IncomingFile&) = delete;
  IncomingFile& operator=(const IncomingFile&) = delete;

  /// Throws std::system_error that names the file.
  void write(std::string_view bytes);
  [[nodiscard]] std::uint64_t bytes() const { return _bytes; }

  /// Gives the file its name in the folder, with ".2", ".3" and so on behind it when there is such a file
  /// already; none is ever replaced. The name that it got. Throws std::system_error that names the file.
  [[nodiscard]] std::string keepAs(const std::string& name);

 private:
  const std::filesystem::path _folder;
  std::string _temporaryPath;
  platform::FileDescriptor _file;
  std::uint64_t _bytes = 0;
};

/// A name that is one file's in a folder, visible and without surprises in a shell: the last component of
/// `wanted`, with "_" for every byte but ASCII letters, digits and "-", "_", "+", "@", "." (which a name does
/// not begin with), cut to kMaximumFileNameBytes; "file" when nothing is left.
[[nodiscard]] std::string safeFileName(std::string_view wanted);

}  // namespace tallyd::station
