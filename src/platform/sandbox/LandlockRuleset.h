// Confinement to parts of the file system, by the kernel's Landlock.
#pragma once

#include <cstdint>
#include <filesystem>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

/// A set of rules that the calling thread, and what it starts later, can be bound to for good. It restricts
/// every way of using the file system that the running kernel's version of Landlock knows; older versions
/// leave some open, such as truncation. From version 6 on it also shuts off signals to other processes and
/// their abstract Unix sockets.
///
/// Every function throws EnforcementError. Threading: one thread.
class LandlockRuleset {
 public:
  enum class Access { Read, Write, Remove };

  LandlockRuleset();

  /// Opens the folder with all that lies below it, or the single file. Returns false when there is no such
  /// thing.
  bool allow(const std::filesystem::path& path, Access access);

  /// Needs no-new-privileges.
  void enforce() const;

 private:
  std::uint64_t _handled = 0;  ///< The rights that the ruleset governs.
  FileDescriptor _ruleset;
};

}  // namespace tallyd::platform
