// Confinement to an allow-list of system calls, by the kernel's seccomp.
#pragma once

#include <memory>
#include <string>
#include <vector>

namespace tallyd::platform {

/// A filter that all threads of the process can be bound to for good. A call that it does not allow fails
/// with EPERM; a call of a foreign architecture ends the process.
///
/// Threading: one thread.
class SystemCallFilter {
 public:
  /// Allows the calls, given by name or by group "@…". Throws ProfileError for a name that is unknown.
  explicit SystemCallFilter(const std::vector<std::string>& names);
  ~SystemCallFilter();

  /// Sets no-new-privileges too. Throws EnforcementError.
  void enforce() const;

 private:
  struct Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace tallyd::platform
