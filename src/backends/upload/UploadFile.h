// The file that a client wants uploaded.
#pragma once

#include <cstdint>
#include <string>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {
class Sandbox;
}

namespace tallyd {

/// A file that was opened through the sandbox, once its extension had been consumed.
struct UploadFile {
  /// False also for a file that is not there. A symbolic link is none, as in a listing of its folder.
  bool isRegular = false;
  platform::FileDescriptor descriptor;  ///< Invalid when the file can't be read.
  std::uint64_t bytes = 0;              ///< Its size when it was opened.

  /// Where the path can be looked at, only what looks like a regular file is opened; where it can't (it may
  /// lie outside what the daemon sees), the descriptor alone tells. Never waits for a pipe or device.
  [[nodiscard]] static UploadFile open(platform::Sandbox& sandbox, const std::string& path);

  /// What the file holds, up to the size that it had when it was opened: what is appended meanwhile stays
  /// out, so that a writer who is faster than the disk fills no memory. Empty when reading fails.
  [[nodiscard]] std::string contents() const;
};

}  // namespace tallyd
