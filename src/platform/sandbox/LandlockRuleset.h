// Confinement to parts of the file system, by the kernel's Landlock.
#pragma once

#include <cstdint>
#include <filesystem>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

/// A set of rules that the calling thread, and what it starts later, can be bound to for good. It restricts
/// every way of using the file system that the running kernel's version of Landlock knows; older versions
/// leave some open, such as truncation. From version 4 on it also keeps the process from taking TCP ports,
/// from version 6 on from signals to other processes and from their abstract Unix sockets.
///
/// Every function throws EnforcementError. Threading: one thread.
class LandlockRuleset {
 public:
  enum class Access { Read, Write, Remove };

  LandlockRuleset();

  /// Opens the folder with all that lies below it, or the single file. Returns false when there is no such
  /// thing.
  bool allow(const std::filesystem::path& path, Access access);

  /// Whether the kernel's audit hears of what is refused, where the kernel can (version 7).
  enum class Refusals { Audited, Quiet };

  /// Needs no-new-privileges. May be done again: rules add up, and the last ones decide about the audit.
  void enforce(Refusals refusals = Refusals::Audited) const;

 private:
  long _version = 0;
  std::uint64_t _handled = 0;  ///< The rights that the ruleset governs.
  FileDescriptor _ruleset;
};

}  // namespace tallyd::platform
