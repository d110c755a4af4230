// What a sandbox profile says.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Root.h"

namespace tallyd::platform {

/// A profile is a property list, a dictionary with these keys:
///
/// - "Read", "Write", "Remove": arrays of folders or single files, each with all that lies below it, which
/// may be read;
///   made, written and moved; removed. One right does not include another. A path lies below the root; one
///   that starts with "system:" is taken as it stands.
/// - "SystemCalls": array of system calls by name, and of groups "@…" (SystemCallGroups.h). Must name
/// something, as no
///   process gets along without any.
/// - "Optional": boolean; true lets the process go on where the system can't enforce the profile.
struct SandboxProfile {
  std::vector<std::filesystem::path> read;
  std::vector<std::filesystem::path> write;
  std::vector<std::filesystem::path> remove;
  std::vector<std::string> systemCalls;
  bool optional = false;
};

/// Reads a profile; nothing in it is passed over. Throws ProfileError.
[[nodiscard]] SandboxProfile sandboxProfileWithData(std::string_view bytes, const Root& root);

}  // namespace tallyd::platform
