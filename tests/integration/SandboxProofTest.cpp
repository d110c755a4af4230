// The daemon tries its own sandbox before it serves anybody, and does not start with one that has a hole.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <set>

#include "integration/TestDaemon.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using testing::AllOf;
using testing::HasSubstr;
using testing::MatchesRegex;

constexpr const char* kProfile = "/usr/share/tally/sandbox/com.quillon.tallyd.plist";
constexpr const char* kRemoval = "remove-system";
constexpr std::string_view kHoles = "<2>The sandbox does not hold. The process could: ";

Dictionary propertyListIn(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  const std::string bytes{std::istreambuf_iterator<char>(file), {}};
  const auto list = platform::propertyListWithData(bytes);
  EXPECT_TRUE(list.value && list.value->dictionary()) << path << ": " << list.error;
  return list.value && list.value->dictionary() ? *list.value->dictionary() : Dictionary();
}

class SandboxProofTest : public testing::Test {
 protected:
  StorebagServer server;
  TestRoot root{server};

  /// Adds to each list of the packaged profile what the fixture `name` has under the same key.
  void loosen(const std::string& name) const {
    Dictionary profile = propertyListIn(root.under(kProfile));
    const Dictionary more = propertyListIn(
        std::filesystem::path(TALLYD_SOURCE_DIR "/tests/fixtures/sandbox") / (name + ".plist"));
    for (const auto& [key, list] : more) {
      Array all = *profile.array(key);
      for (const Value& each : *list.array()) all.append(each);
      profile.set(key, all);
    }
    writeProfile(profile);
  }

  void writeProfile(const Dictionary& profile) const {
    root.write(kProfile, *platform::dataWithPropertyList(profile, platform::PropertyListFormat::XML));
  }

  WatchedProcess run(std::vector<std::string> more = {"--log", "stderr"}) const {
    std::vector<std::string> arguments{TestDaemon::program(), "--root", root.root().directory().string()};
    arguments.insert(arguments.end(), more.begin(), more.end());
    // A search for leaks at the end would trace the process, which is what the sandbox is for.
    return WatchedProcess({.arguments = arguments, .environment = {{"ASAN_OPTIONS", "detect_leaks=0"}}});
  }

  static std::string holesIn(const WatchedProcess& process) {
    for (const auto& line : process.lines()) {
      if (line.starts_with(kHoles)) return line.substr(kHoles.size());
    }
    return "";
  }
};

struct Loosened {
  const char* fixture;
  const char* hole;  ///< A regular expression for all that the daemon tells.
};

class LoosenedSandboxTest : public SandboxProofTest, public testing::WithParamInterface<Loosened> {};

TEST_P(LoosenedSandboxTest, KeepsTheDaemonFromStarting) {
  loosen(GetParam().fixture);
  auto process = run();
  EXPECT_EQ(process.wait().code, 255);
  EXPECT_THAT(holesIn(process), MatchesRegex(GetParam().hole)) << process.output();
  EXPECT_EQ(process.count("<6>Listener resumes with sandbox, start loop."), 0U);
  EXPECT_FALSE(std::filesystem::exists(root.socket()));
}

const std::vector<Loosened> kLoosened{

    Loosened{"read-tmp", "read /tmp"},
    Loosened{"read-home", "read /home"},
    Loosened{"read-everything", "read /; read /tmp; .*; read /proc/version(; read /proc/kmsg)?"},
    Loosened{"read-processes", "read /proc; read /proc/version(; read /proc/kmsg)?"},
    Loosened{"write-tmp", "make files in /tmp"},
    Loosened{"write-shared-memory", "make files in /dev/shm"},
    Loosened{"write-memory", "write to /proc/self/mem; write to /proc/self/oom_score_adj"},
    Loosened{"execute", "execute a program \\(execve, execveat\\)"},
    Loosened{"fork", "start a process \\((fork, vfork, )?clone, clone3\\)"},
    Loosened{"trace", "trace a process \\(ptrace, process_vm_readv\\)"},
    Loosened{"signal", "signal other processes \\(kill, tgkill\\)"},
    Loosened{"raw-socket",
             "open a raw or packet socket \\(socket\\); open a socket of a rare protocol \\(socket\\)"},
    Loosened{"listen", "listen on the network \\(listen\\)"},
    Loosened{"limits", "change its limits \\(prlimit64(, setrlimit)?\\)"},
    Loosened{"identity", "change its identity \\(setuid, setresuid(, setgroups)?, capset\\)"},
    Loosened{"mount", "change file systems \\(mount, chroot\\)"},
    Loosened{"kernel-code", "load code into the kernel \\(bpf(, kexec_load)?\\)"},
    Loosened{"kernel", "reach into the kernel \\(keyctl, unshare, io_uring_setup\\)"}};

INSTANTIATE_TEST_SUITE_P(Probes, LoosenedSandboxTest, testing::ValuesIn(kLoosened), [](const auto& each) {
  std::string name = each.param.fixture;
  std::replace(name.begin(), name.end(), '-', '_');
  return name;
});

TEST_F(SandboxProofTest, EveryFixtureIsTried) {
  std::set<std::string> tried{kRemoval};
  for (const auto& each : kLoosened) tried.insert(each.fixture);
  std::set<std::string> there;
  for (const auto& entry : std::filesystem::directory_iterator(TALLYD_SOURCE_DIR "/tests/fixtures/sandbox")) {
    there.insert(entry.path().stem());
  }
  EXPECT_EQ(tried, there);
}

TEST_F(SandboxProofTest, RemovingTheSystemIsAHoleWhereItsModesDoNotForbidIt) {
  loosen(kRemoval);
  if (::geteuid() == 0) {
    auto process = run();
    EXPECT_EQ(process.wait().code, 255);
    EXPECT_EQ(holesIn(process), "remove /usr/lib");
  } else {
    TestDaemon daemon(root);
    EXPECT_TRUE(daemon.process().waitForLine("<6>Listener resumes with sandbox, start loop."));
  }
}

TEST_F(SandboxProofTest, NamesEveryHoleAndTellsWhoStartedTheDaemon) {
  loosen("read-tmp");
  loosen("execute");
  loosen("limits");
  auto process = run({"--log", "syslog"});
  EXPECT_EQ(process.wait().code, 255);
  EXPECT_THAT(process.output(),
              AllOf(HasSubstr("tallyd: The sandbox does not hold. The process could: read /tmp; "),
                    HasSubstr("execute a program (execve, execveat); "), HasSubstr("change its limits (")));
}

TEST_F(SandboxProofTest, TriesNothingWithoutASandbox) {
  loosen("read-everything");
  TestDaemon daemon(root, {.arguments = {"--no-sandbox"}});
  EXPECT_EQ(daemon.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
  EXPECT_EQ(holesIn(daemon.process()), "");
}

TEST_F(SandboxProofTest, AHoleIsNoneOfTheThingsThatAnOptionalProfileGoesWithout) {
  loosen("execute");
  Dictionary profile = propertyListIn(root.under(kProfile));
  profile.set("Optional", true);
  writeProfile(profile);
  auto process = run();
  EXPECT_EQ(process.wait().code, 255);
  EXPECT_EQ(holesIn(process), "execute a program (execve, execveat)");
}

TEST_F(SandboxProofTest, AnOptionalProfileThatHoldsLetsTheDaemonStart) {
  Dictionary profile = propertyListIn(root.under(kProfile));
  profile.set("Optional", true);
  writeProfile(profile);
  TestDaemon daemon(root);
  EXPECT_EQ(daemon.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
}

TEST_F(SandboxProofTest, AddsNoLineToAStartThatSucceeds) {
  TestDaemon daemon(root);
  EXPECT_TRUE(daemon.process().waitForLine("<6>Listener resumes with sandbox, start loop."));
  EXPECT_EQ(daemon.process().lines().size(), 1U) << daemon.process().output();
}

}  // namespace
}  // namespace tallyd::test
