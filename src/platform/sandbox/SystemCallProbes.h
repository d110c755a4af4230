// Tries the system calls that a confined process must not get through to the kernel.
#pragma once

#include <string>
#include <vector>

namespace tallyd::platform {

/// A thing that no process in the sandbox may do, and the calls by which it would be done.
struct ForbiddenAct {
  std::string name;  ///< "execute a program"
  std::vector<std::string> calls;
};

/// What the filter of system calls let through to the kernel, by act. Empty where it holds.
///
/// A call counts as refused when it fails with EPERM or ENOSYS, as the filter and the kernel's own checks of
/// privilege have it. Every other end, also that of a call which fails over its arguments or over Landlock,
/// counts as let through. The arguments are chosen so that no call has an effect when it is; a process that
/// may be forked leaves a child that ends at once.
///
/// A process with other filters beside its own: they must answer with an error, not end the process.
[[nodiscard]] std::vector<ForbiddenAct> systemCallsLetThrough();

/// Everything that is tried, for tests and the documentation.
[[nodiscard]] std::vector<ForbiddenAct> forbiddenActs();

}  // namespace tallyd::platform
