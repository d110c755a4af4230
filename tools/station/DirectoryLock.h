// One station to a directory.
#pragma once

#include <filesystem>

#include "platform/FileDescriptor.h"

namespace tallyd::station {

/// Keeps every other station out of a directory while this object lives, by a lock on DIR/station.lock. The
/// system gives the lock back with the process, however it ends; the file stays.
class DirectoryLock {
 public:
  /// Makes the directory when it is missing. Throws an exception that names the lock file when another
  /// station has it, with that station's process ID, or when the lock can't be had.
  explicit DirectoryLock(const std::filesystem::path& directory);

 private:
  platform::FileDescriptor _file;
};

}  // namespace tallyd::station
