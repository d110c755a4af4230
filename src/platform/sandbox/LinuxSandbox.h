// The sandbox of a Linux process: Landlock for files, seccomp for system calls.
#pragma once

#include "platform/Log.h"
#include "platform/Root.h"
#include "platform/Sandbox.h"
#include "platform/sandbox/FileGrants.h"

namespace tallyd::platform {

struct SandboxProfile;

/// Confines by the profile "usr/share/tally/sandbox/NAME.plist" below the root; SandboxProfile.h says what
/// stands in it.
///
/// Folders that the profile has written are made when they are missing; other missing folders stay out of
/// reach for the life of the process.
class LinuxSandbox final : public Sandbox {
 public:
  /// Borrows both; they must outlive this object. Confines nothing yet.
  LinuxSandbox(const Root& root, Log& log) : _root(root), _log(log) {}

  [[nodiscard]] std::optional<std::string> sandbox_init(std::string_view profileName) override;

  /// Tries what no confined process may do, whatever its profile says: what the process could do all the
  /// same, as a text each. Parts that an optional profile went without are not tried.
  ///
  /// After sandbox_init(), and like it before any thread starts.
  [[nodiscard]] std::vector<std::string> holes() const;

  [[nodiscard]] std::unique_ptr<Grant> offerGrant(std::string_view token,
                                                  std::vector<FileDescriptor> descriptors) override;
  ExtensionHandle sandbox_extension_consume(std::string_view token) override;
  void sandbox_extension_release(ExtensionHandle handle) override;
  [[nodiscard]] FileDescriptor openForReading(std::string_view path) override;

 private:
  void confine(const std::filesystem::path& profilePath);
  void restrictFiles(const SandboxProfile& profile);

  const Root& _root;
  Log& _log;
  FileGrants _grants;
  std::vector<std::string> _fileHoles;  ///< Tried while the refusals are not audited.
  bool _restrictsCalls = false;
};

}  // namespace tallyd::platform
