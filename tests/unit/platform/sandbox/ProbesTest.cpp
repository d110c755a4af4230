// The probes themselves: that each of them notices, and that none has an effect.

#include <gmock/gmock.h>
#include <seccomp.h>
#include <sys/prctl.h>
#include <sys/resource.h>

#include <tuple>

#include "SandboxTestSupport.h"
#include "platform/sandbox/FileProbes.h"
#include "platform/sandbox/LandlockRuleset.h"
#include "platform/sandbox/SystemCallFilter.h"
#include "platform/sandbox/SystemCallGroups.h"
#include "platform/sandbox/SystemCallProbes.h"

namespace tallyd::platform {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;

std::string textOf(const std::vector<ForbiddenAct>& acts) {
  std::string text;
  for (const auto& [name, calls] : acts) {
    text += name + ":";
    for (const auto& call : calls) text += " " + call;
    text += "\n";
  }
  return text;
}

std::string textOf(const std::vector<std::string>& lines) {
  std::string text;
  for (const auto& line : lines) text += line + "\n";
  return text;
}

/// The acts without the calls that this architecture lacks.
std::vector<ForbiddenAct> actsOfThisArchitecture() {
  auto acts = forbiddenActs();
  for (auto& act : acts) {
    std::erase_if(act.calls,
                  [](const auto& call) { return ::seccomp_syscall_resolve_name(call.c_str()) < 0; });
  }
  std::erase_if(acts, [](const auto& act) { return act.calls.empty(); });
  return acts;
}

/// Answers each forbidden call with `error`, without asking the kernel.
void answerForbiddenCallsWith(std::uint32_t error) {
  scmp_filter_ctx filter = ::seccomp_init(SCMP_ACT_ALLOW);
  for (const auto& [name, calls] : actsOfThisArchitecture()) {
    for (const auto& call : calls) {
      const int number = ::seccomp_syscall_resolve_name(call.c_str());
      if (call == "prlimit64") {
        ::seccomp_rule_add(filter, SCMP_ACT_ERRNO(error), number, 1, SCMP_A2(SCMP_CMP_NE, 0));
      } else {
        ::seccomp_rule_add(filter, SCMP_ACT_ERRNO(error), number, 0);
      }
    }
  }
  ::seccomp_load(filter);
  ::seccomp_release(filter);
}

std::vector<std::string> allGroups() {
  std::vector<std::string> names;
  for (const auto& group : systemCallGroups()) names.emplace_back(group.name);
  return names;
}

TEST(SystemCallProbesTest, NoticeEachCallThatIsNotRefused) {
  EXPECT_EQ(inChild([] {
              answerForbiddenCallsWith(ERANGE);
              return textOf(systemCallsLetThrough());
            }),
            textOf(actsOfThisArchitecture()));
}

TEST(SystemCallProbesTest, TakeOnlyEPERMAndENOSYSForRefusals) {
  for (const int error : {EPERM, ENOSYS}) {
    EXPECT_EQ(inChild([&] {
                answerForbiddenCallsWith(static_cast<std::uint32_t>(error));
                return textOf(systemCallsLetThrough());
              }),
              "");
  }
}

TEST(SystemCallProbesTest, FindNothingBehindAllGroupsTogether) {
  EXPECT_EQ(inChild([] {
              SystemCallFilter(allGroups()).enforce();
              return textOf(systemCallsLetThrough());
            }),
            "");
}

TEST(SystemCallProbesTest, HaveNoEffectOnAProcessThatMayDoEverything) {
  EXPECT_EQ(inChild([]() -> std::string {
              rlimit before{};
              rlimit after{};
              ::getrlimit(RLIMIT_NOFILE, &before);
              const auto ids = std::tuple(::getuid(), ::geteuid(), ::getgid(), ::getegid());
              const auto found = systemCallsLetThrough();
              ::getrlimit(RLIMIT_NOFILE, &after);
              if (found.empty()) return "nothing was noticed";
              if (before.rlim_cur != after.rlim_cur || before.rlim_max != after.rlim_max) return "limits";
              if (ids != std::tuple(::getuid(), ::geteuid(), ::getgid(), ::getegid())) return "identity";
              return "as before";
            }),
            "as before");
}

TEST(FileProbesTest, NoticePlacesThatStandOpen) {
  EXPECT_THAT(textOf(reachableFiles()),
              AllOf(HasSubstr("read /\n"), HasSubstr("read /tmp\n"), HasSubstr("read /proc/version\n"),
                    HasSubstr("write to /dev/full\n"), HasSubstr("make files in /tmp\n")));
}

TEST(FileProbesTest, LeaveNothingBehind) {
  const auto entries = [] {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
      if (entry.path().filename().string().starts_with(".tallyd")) names.push_back(entry.path());
    }
    return names;
  };
  EXPECT_FALSE(reachableFiles().empty());
  EXPECT_THAT(entries(), IsEmpty());
}

TEST(FileProbesTest, FindNothingWhereNothingIsAllowed) {
  EXPECT_EQ(inChild([] {
              ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
              LandlockRuleset().enforce();
              return textOf(reachableFiles());
            }),
            "");
}

struct LooseRule {
  const char* path;
  LandlockRuleset::Access access;
  const char* hole;  ///< One of those that it opens.
};

class LooseRuleTest : public testing::TestWithParam<LooseRule> {};

TEST_P(LooseRuleTest, IsNoticed) {
  const auto& rule = GetParam();
  const std::string holes = inChild([&] {
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    LandlockRuleset rules;
    rules.allow(rule.path, rule.access);
    rules.enforce(LandlockRuleset::Refusals::Quiet);
    return textOf(reachableFiles());
  });
  EXPECT_THAT("\n" + holes, HasSubstr("\n" + std::string(rule.hole) + "\n"));
}

using Access = LandlockRuleset::Access;
INSTANTIATE_TEST_SUITE_P(Probes, LooseRuleTest,
                         testing::Values(LooseRule{"/", Access::Read, "read /"},
                                         LooseRule{"/tmp", Access::Read, "read /tmp"},
                                         LooseRule{"/proc", Access::Read, "read /proc/version"},
                                         LooseRule{"/dev", Access::Read, "read /dev"},
                                         LooseRule{"/tmp", Access::Write, "make files in /tmp"},
                                         LooseRule{"/var/tmp", Access::Write, "make files in /var/tmp"},
                                         LooseRule{"/proc/self", Access::Write, "write to /proc/self/mem"},
                                         LooseRule{"/dev/full", Access::Write, "write to /dev/full"}));

}  // namespace
}  // namespace tallyd::platform
