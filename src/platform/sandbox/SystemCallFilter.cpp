#include "platform/sandbox/SystemCallFilter.h"

#include <fmt/format.h>
#include <seccomp.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/sandbox/SandboxErrors.h"
#include "platform/sandbox/SystemCallGroups.h"

namespace tallyd::platform {

struct SystemCallFilter::Implementation {
  ~Implementation() { ::seccomp_release(context); }

  void set(scmp_filter_attr attribute, std::uint32_t value) const {
    const int error = ::seccomp_attr_set(context, attribute, value);
    if (error != 0) fail(error);
  }

  [[noreturn]] static void fail(int error) {
    throw EnforcementError(
        fmt::format("the kernel can't restrict system calls (seccomp): {}", std::strerror(-error)));
  }

  void add(const char* name, std::uint32_t action, const std::vector<ArgumentCondition>& conditions) const {
    const int number = ::seccomp_syscall_resolve_name(name);
    if (number < 0) return;  // Another architecture's call, or one that this libseccomp is too old to know.
    std::vector<scmp_arg_cmp> comparisons;
    comparisons.reserve(conditions.size());
    for (const auto& [argument, mask, bits] : conditions) {
      comparisons.push_back({.arg = argument, .op = SCMP_CMP_MASKED_EQ, .datum_a = mask, .datum_b = bits});
    }
    const int error = ::seccomp_rule_add_array(context, action, number,
                                               static_cast<unsigned>(comparisons.size()), comparisons.data());
    // A rule that another one covers already is refused as existing.
    if (error != 0 && error != -EEXIST) {
      throw EnforcementError(
          fmt::format("no filter rule for the system call {}: {}", name, std::strerror(-error)));
    }
  }

  void allow(const std::string& name, const std::vector<SystemCallGroup>& groups) const {
    if (name.starts_with('@')) {
      const auto group =
          std::find_if(groups.begin(), groups.end(), [&](const auto& each) { return each.name == name; });
      if (group == groups.end()) throw ProfileError(fmt::format("\"{}\" is no group of system calls", name));
      for (const auto& rule : group->rules) add(rule.name, SCMP_ACT_ALLOW, rule.conditions);
    } else {
      if (::seccomp_syscall_resolve_name(name.c_str()) == __NR_SCMP_ERROR) {
        throw ProfileError(fmt::format("\"{}\" is no system call", name));
      }
      add(name.c_str(), SCMP_ACT_ALLOW, {});
    }
  }

  scmp_filter_ctx context = ::seccomp_init(SCMP_ACT_ERRNO(EPERM));
};

SystemCallFilter::SystemCallFilter(const std::vector<std::string>& names)
    : _implementation(std::make_unique<Implementation>()) {
  if (!_implementation->context) throw EnforcementError("no filter of system calls could be made");
  _implementation->set(SCMP_FLTATR_API_SYSRAWRC, 1);
  _implementation->set(SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS);
  _implementation->set(SCMP_FLTATR_CTL_OPTIMIZE,
                       2);  // A binary tree: long lists cost no more than short ones.
  const auto groups = systemCallGroups();
  for (const auto& name : names) _implementation->allow(name, groups);
  // The flags of clone3 lie in memory, out of the filter's sight. Without it the C library takes clone.
  if (std::find(names.begin(), names.end(), "clone3") == names.end()) {
    _implementation->add("clone3", SCMP_ACT_ERRNO(ENOSYS), {});
  }
}

SystemCallFilter::~SystemCallFilter() = default;

void SystemCallFilter::enforce() const {
  _implementation->set(SCMP_FLTATR_CTL_TSYNC, 1);
  const int error = ::seccomp_load(_implementation->context);
  if (error != 0) Implementation::fail(error);
}

}  // namespace tallyd::platform
