// The groups of system calls that sandbox profiles allow by one name.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace tallyd::platform {

/// A demand on one argument of a call: its bits under the mask are these.
struct ArgumentCondition {
  unsigned argument;  ///< Counted from zero.
  std::uint64_t mask;
  std::uint64_t bits;
};

/// A call that is allowed when every condition holds. Several rules for one call add up.
struct SystemCallRule {
  const char* name;
  std::vector<ArgumentCondition> conditions;
};

/// What every group of rules is about, for messages and the documentation.
struct SystemCallGroup {
  std::string_view name;    ///< Starts with "@".
  std::string_view reason;  ///< Why a daemon needs it.
  std::vector<SystemCallRule> rules;
};

/// All groups. Some rules hold for the calling process only (its ID stands in their conditions).
///
/// None of the groups starts programs or processes, traces, mounts, changes users or loads code into the
/// kernel.
[[nodiscard]] std::vector<SystemCallGroup> systemCallGroups();

}  // namespace tallyd::platform
