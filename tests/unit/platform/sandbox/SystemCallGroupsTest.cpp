#include "platform/sandbox/SystemCallGroups.h"

#include <gtest/gtest.h>
#include <seccomp.h>

#include <set>
#include <string>

#include "platform/sandbox/SystemCallProbes.h"

namespace tallyd::platform {
namespace {

TEST(SystemCallGroupsTest, NameOnlyCallsThatExist) {
  for (const auto& group : systemCallGroups()) {
    for (const auto& rule : group.rules) {
      EXPECT_NE(::seccomp_syscall_resolve_name(rule.name), __NR_SCMP_ERROR) << group.name << " " << rule.name;
    }
  }
}

TEST(SystemCallGroupsTest, NameEachCallInOneGroupOnly) {
  std::set<std::string> seen;
  for (const auto& group : systemCallGroups()) {
    std::set<std::string> own;
    for (const auto& rule : group.rules) own.insert(rule.name);
    for (const auto& name : own) EXPECT_TRUE(seen.insert(name).second) << name;
  }
}

TEST(SystemCallGroupsTest, HaveNamesAndReasons) {
  std::set<std::string_view> names;
  for (const auto& group : systemCallGroups()) {
    EXPECT_TRUE(group.name.starts_with('@')) << group.name;
    EXPECT_FALSE(group.reason.empty()) << group.name;
    EXPECT_FALSE(group.rules.empty()) << group.name;
    EXPECT_TRUE(names.insert(group.name).second) << group.name;
  }
}

TEST(SystemCallGroupsTest, LeaveOutWhatTheProbesTryAndWhatTakesOverASystem) {
  // What only some arguments are allowed of; the conditions are tested where they are in force.
  const std::set<std::string> conditional{"socket", "clone", "tgkill", "prlimit64", "prctl", "ioctl"};
  std::set<std::string> forbidden{"chmod", "fchmod", "inotify_init1", "link", "mlockall", "setns", "setsid"};
  for (const auto& act : forbiddenActs()) {
    for (const auto& call : act.calls) {
      if (!conditional.contains(call)) forbidden.insert(call);
    }
  }
  for (const auto& group : systemCallGroups()) {
    for (const auto& rule : group.rules)
      EXPECT_FALSE(forbidden.contains(rule.name)) << group.name << " " << rule.name;
  }
}

TEST(SystemCallGroupsTest, LetNoCallWithConditionsThroughWithoutThem) {
  const std::set<std::string> conditional{"ioctl",  "socket",    "socketpair", "clone",
                                          "tgkill", "prlimit64", "prctl"};
  for (const auto& group : systemCallGroups()) {
    for (const auto& rule : group.rules) {
      EXPECT_EQ(conditional.contains(rule.name), !rule.conditions.empty()) << rule.name;
    }
  }
}

}  // namespace
}  // namespace tallyd::platform
