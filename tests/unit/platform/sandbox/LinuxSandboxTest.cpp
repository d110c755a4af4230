#include "platform/sandbox/LinuxSandbox.h"

#include <gmock/gmock.h>
#include <linux/seccomp.h>
#include <netinet/in.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <csignal>
#include <thread>

#include "SandboxTestSupport.h"

namespace tallyd::platform {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::MatchesRegex;

constexpr std::string_view kAllCalls =
    "<string>@basic-io</string><string>@files</string><string>@network</string><string>@threads</string>"
    "<string>@time</string><string>@memory</string><string>@signals</string><string>@process</string>";

std::string arrayOf(std::string_view key, const std::vector<std::string>& texts) {
  std::string xml = "<key>" + std::string(key) + "</key><array>";
  for (const auto& text : texts) xml += "<string>" + text + "</string>";
  return xml + "</array>";
}

/// Has the kernel answer some calls of this process with ENOSYS, as one that is too old does.
void pretendTheKernelLacks(const std::vector<const char*>& calls) {
  scmp_filter_ctx filter = ::seccomp_init(SCMP_ACT_ALLOW);
  for (const char* call : calls) {
    ::seccomp_rule_add(filter, SCMP_ACT_ERRNO(ENOSYS), ::seccomp_syscall_resolve_name(call), 0);
  }
  ::seccomp_load(filter);
  ::seccomp_release(filter);
}

class LinuxSandboxTest : public testing::Test {
 protected:
  void SetUp() override {
    writeFile(path("open/file"), "open");
    writeFile(path("open/deep/file"), "deep");
    writeFile(path("shut/file"), "shut");
    writeFile(path("work/file"), "work");
    writeFile(path("single"), "single");
  }

  std::filesystem::path path(std::string_view relative) const { return _folder.path() / relative; }

  void writeProfile(std::string_view entries, std::string_view calls = kAllCalls) {
    writeFile(path("usr/share/tally/sandbox/test.plist"),
              R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)" + std::string(entries) +
                  "<key>SystemCalls</key><array>" + std::string(calls) + "</array></dict></plist>");
  }

  /// The usual profile: one folder to read, one to work in.
  void writeUsualProfile(std::string_view calls = kAllCalls) {
    writeProfile(arrayOf("Read", {"open", "/work", "single", "missing"}) +
                     arrayOf("Write", {"work", "made/on/demand"}) + arrayOf("Remove", {"work"}),
                 calls);
  }

  /// What `body` returns in a child that entered the sandbox.
  std::string confined(const std::function<std::string()>& body) {
    return inChild([&]() -> std::string {
      const auto error = _sandbox.sandbox_init("test");
      return error ? "not confined: " + *error : body();
    });
  }

  std::string confinedOutcome(const std::function<long()>& call) {
    return confined([&] { return outcome(call()); });
  }

  /// How sandbox_init ends in a child: the error, else the log.
  std::string ending(std::string_view profile = "test", const std::vector<const char*>& lacking = {}) {
    return inChild([&]() -> std::string {
      if (!lacking.empty()) pretendTheKernelLacks(lacking);
      const auto error = _sandbox.sandbox_init(profile);
      return error ? *error : "confined\n" + _log.lines;
    });
  }

  const TemporaryFolder _folder;
  const Root _root{_folder.path()};
  KeptLog _log;
  LinuxSandbox _sandbox{_root, _log};
};

TEST_F(LinuxSandboxTest, ReadsOnlyWhereTheProfileSays) {
  writeUsualProfile();
  EXPECT_EQ(confined([&] {
              return inTurn({outcomeOfOpening(path("open/file"), O_RDONLY),
                             outcomeOfOpening(path("open/deep/file"), O_RDONLY),
                             outcomeOfOpening(path("open"), O_RDONLY | O_DIRECTORY),
                             outcomeOfOpening(path("single"), O_RDONLY)});
            }),
            "ok ok ok ok");
  EXPECT_EQ(
      confined([&] {
        return inTurn({outcomeOfOpening(path("shut/file"), O_RDONLY),
                       outcomeOfOpening(path("shut"), O_RDONLY), outcomeOfOpening("/etc/passwd", O_RDONLY)});
      }),
      "EACCES EACCES EACCES");
}

TEST_F(LinuxSandboxTest, WritesOnlyWhereTheProfileSays) {
  writeUsualProfile(std::string(kAllCalls) + "<string>truncate</string>");
  EXPECT_EQ(confined([&] {
              return inTurn({outcomeOfOpening(path("work/new"), O_WRONLY | O_CREAT),
                             outcomeOfOpening(path("work/file"), O_RDWR | O_TRUNC),
                             outcome(::mkdir(path("work/folder").c_str(), 0755)),
                             outcomeOfOpening(path("work/folder/new"), O_WRONLY | O_CREAT)});
            }),
            "ok ok ok ok");
  EXPECT_EQ(confined([&] {
              return inTurn({outcomeOfOpening(path("open/file"), O_WRONLY),
                             outcomeOfOpening(path("open/new"), O_WRONLY | O_CREAT),
                             outcome(::mkdir(path("shut/folder").c_str(), 0755)),
                             outcome(::truncate(path("open/file").c_str(), 0))});
            }),
            "EACCES EACCES EACCES EACCES");
  EXPECT_FALSE(std::filesystem::exists(path("open/new")));
}

TEST_F(LinuxSandboxTest, RemovesOnlyWhereTheProfileSays) {
  writeProfile(arrayOf("Write", {"work", "shut"}) + arrayOf("Remove", {"work"}));
  std::filesystem::create_directory(path("work/folder"));
  EXPECT_EQ(confined([&] {
              return inTurn({outcome(::unlink(path("work/file").c_str())),
                             outcome(::rmdir(path("work/folder").c_str())),
                             outcome(::unlink(path("shut/file").c_str())),
                             outcome(::unlink(path("open/file").c_str()))});
            }),
            "ok ok EACCES EACCES");
  EXPECT_TRUE(std::filesystem::exists(path("shut/file")));
}

TEST_F(LinuxSandboxTest, ReplacesFilesByRenaming) {
  writeUsualProfile();
  EXPECT_EQ(
      confined([&] {
        return inTurn({outcomeOfOpening(path("work/next"), O_WRONLY | O_CREAT),
                       outcome(::rename(path("work/next").c_str(), path("work/file").c_str())),
                       outcome(::mkdir(path("work/folder").c_str(), 0755)),
                       outcome(::rename(path("work/file").c_str(), path("work/folder/file").c_str())),
                       outcome(::rename(path("work/folder/file").c_str(), path("open/stolen").c_str()))});
      }),
      "ok ok ok ok EACCES");
}

TEST_F(LinuxSandboxTest, MakesFoldersToWriteAndPassesOverMissingOnesToRead) {
  writeUsualProfile();
  EXPECT_EQ(confined([&] {
              return outcomeOfOpening(path("made/on/demand/file"), O_WRONLY | O_CREAT) + _log.lines;
            }),
            "ok");
  EXPECT_TRUE(std::filesystem::exists(path("made/on/demand/file")));
  EXPECT_FALSE(std::filesystem::exists(path("missing")));
}

TEST_F(LinuxSandboxTest, WarnsOfAFolderThatCannotBeMade) {
  writeProfile(arrayOf("Write", {"single/folder"}));
  EXPECT_THAT(ending(), MatchesRegex("confined\n4 Sandbox: can't make .*/single/folder: .*\n"));
}

TEST_F(LinuxSandboxTest, TakesSystemPathsAsTheyStand) {
  writeProfile(arrayOf("Read", {"system:/etc/passwd", "system:/dev/null"}) +
               arrayOf("Write", {"system:/dev/null"}));
  EXPECT_EQ(
      confined([&] {
        return inTurn({outcomeOfOpening("/etc/passwd", O_RDONLY), outcomeOfOpening("/dev/null", O_RDWR),
                       outcomeOfOpening("/etc/group", O_RDONLY), outcomeOfOpening("/dev/zero", O_RDONLY)});
      }),
      "ok ok EACCES EACCES");
}

TEST_F(LinuxSandboxTest, StartsNoProgramsAndNoProcesses) {
  writeProfile(arrayOf("Read", {"system:/"}));
  char name[] = "true";
  char* arguments[] = {name, nullptr};
  EXPECT_EQ(confinedOutcome([&] { return ::execve("/bin/true", arguments, nullptr); }), "EPERM");
  EXPECT_EQ(
      confinedOutcome([&] { return ::syscall(SYS_clone, SIGCHLD, nullptr, nullptr, nullptr, nullptr); }),
      "EPERM");
  EXPECT_EQ(confinedOutcome([&] { return ::syscall(SYS_clone3, nullptr, 0); }), "ENOSYS");
}

TEST_F(LinuxSandboxTest, ExecutesNothingEvenWhereTheCallIsAllowed) {
  writeProfile(arrayOf("Read", {"system:/"}), std::string(kAllCalls) + "<string>execve</string>");
  char name[] = "true";
  char* arguments[] = {name, nullptr};
  EXPECT_EQ(confinedOutcome([&] { return ::execve("/bin/true", arguments, nullptr); }), "EACCES");
}

TEST_F(LinuxSandboxTest, RefusesWhatTakesOverASystem) {
  writeUsualProfile();
  EXPECT_EQ(confinedOutcome([] { return ::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::mount("none", "/mnt", "tmpfs", 0, nullptr); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::unshare(CLONE_NEWUSER); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::syscall(SYS_bpf, 0, nullptr, 0); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::prctl(PR_SET_DUMPABLE, 1); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::ioctl(0, TIOCSTI, "x"); }), "EPERM");
}

TEST_F(LinuxSandboxTest, OpensOrdinarySocketsOnly) {
  writeUsualProfile();
  const auto opened = [this](int family, int type, int protocol) {
    return confinedOutcome([=] { return ::socket(family, type, protocol); });
  };
  EXPECT_EQ(opened(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0), "ok");
  EXPECT_EQ(opened(AF_INET, SOCK_STREAM, IPPROTO_TCP), "ok");
  EXPECT_EQ(opened(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0), "ok");
  EXPECT_EQ(opened(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, 0), "ok");
  EXPECT_EQ(opened(AF_NETLINK, SOCK_RAW, 15), "EPERM") << "the kernel's uevents";
  EXPECT_EQ(opened(AF_INET, SOCK_RAW, IPPROTO_ICMP), "EPERM");
  EXPECT_EQ(opened(AF_PACKET, SOCK_DGRAM, 0), "EPERM");
  EXPECT_EQ(opened(AF_VSOCK, SOCK_STREAM, 0), "EPERM");
  EXPECT_EQ(opened(AF_INET, SOCK_STREAM, IPPROTO_SCTP), "EPERM");
  EXPECT_EQ(opened(AF_INET, SOCK_DGRAM, IPPROTO_ICMP), "EPERM");
}

TEST_F(LinuxSandboxTest, SignalsOnlyItself) {
  writeUsualProfile();
  const pid_t parent = ::getpid();
  EXPECT_EQ(confinedOutcome([&] { return ::kill(parent, 0); }), "EPERM");
  EXPECT_EQ(confinedOutcome([&] { return ::syscall(SYS_tgkill, parent, parent, 0); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::raise(0); }), "ok");
}

TEST_F(LinuxSandboxTest, AbortStillEndsTheProcess) {
  writeUsualProfile();
  const std::string end = confined([]() -> std::string {
    std::signal(SIGABRT, SIG_DFL);
    ::abort();
  });
  EXPECT_THAT(end, MatchesRegex("\\[ended with status (6|134)\\]"));
}

TEST_F(LinuxSandboxTest, HoldsForThreadsToo) {
  writeUsualProfile();
  EXPECT_EQ(confined([&] {
              std::string seen;
              std::thread([&] {
                seen = inTurn({outcomeOfOpening(path("shut/file"), O_RDONLY),
                               outcomeOfOpening(path("open/file"), O_RDONLY),
                               outcome(::socket(AF_INET, SOCK_RAW, IPPROTO_ICMP))});
              }).join();
              return seen;
            }),
            "EACCES ok EPERM");
}

TEST_F(LinuxSandboxTest, ForbidsNewPrivilegesForGood) {
  writeProfile(arrayOf("Read", {}), std::string(kAllCalls) + "<string>prctl</string>");
  EXPECT_EQ(confined([] { return std::to_string(::prctl(PR_GET_NO_NEW_PRIVS, 0, 0, 0, 0)); }), "1");
}

TEST_F(LinuxSandboxTest, AllowsSingleCallsByName) {
  writeProfile(
      "",
      "<string>@basic-io</string><string>@memory</string><string>@signals</string><string>@threads</string>"
      "<string>exit_group</string><string>getpid</string>");
  EXPECT_EQ(confinedOutcome([] { return ::syscall(SYS_getppid); }), "EPERM");
  EXPECT_EQ(confinedOutcome([] { return ::syscall(SYS_getpid); }), "ok");
}

TEST_F(LinuxSandboxTest, NamesTheProfileThatIsMissing) {
  EXPECT_THAT(ending("none"), AllOf(HasSubstr(path("usr/share/tally/sandbox/none.plist").string()),
                                    EndsWith("can't be opened: No such file or directory")));
}

TEST_F(LinuxSandboxTest, RefusesNamesThatLeadElsewhere) {
  EXPECT_THAT(ending("../sandbox/test"), HasSubstr("\"../sandbox/test\" is no name"));
  EXPECT_THAT(ending(""), HasSubstr("is no name"));
}

TEST_F(LinuxSandboxTest, NamesWhatIsBrokenInAProfile) {
  writeFile(path("usr/share/tally/sandbox/test.plist"), "<plist version=\"1.0\"><dict><key>");
  EXPECT_THAT(ending(), AllOf(HasSubstr("test.plist"), HasSubstr("no property list")));
  writeProfile("<key>Read</key><true/>");
  EXPECT_THAT(ending(), AllOf(HasSubstr("test.plist"), EndsWith("\"Read\" is not an array")));
}

TEST_F(LinuxSandboxTest, NamesSystemCallsAndGroupsThatItDoesNotKnow) {
  writeProfile("<key>Optional</key><true/>", "<string>read</string><string>rewd</string>");
  EXPECT_THAT(ending(), AllOf(HasSubstr("test.plist"), EndsWith("\"rewd\" is no system call")));
  writeProfile("<key>Optional</key><true/>", "<string>@everything</string>");
  EXPECT_THAT(ending(),
              AllOf(HasSubstr("test.plist"), EndsWith("\"@everything\" is no group of system calls")));
}

TEST_F(LinuxSandboxTest, FailsWhereFilesCannotBeRestricted) {
  writeUsualProfile();
  EXPECT_THAT(ending("test", {"landlock_create_ruleset"}),
              AllOf(HasSubstr("test.plist"), HasSubstr("Landlock"), EndsWith("Function not implemented")));
  EXPECT_THAT(ending("test", {"landlock_restrict_self"}), HasSubstr("Landlock"));
}

TEST_F(LinuxSandboxTest, FailsWhereSystemCallsCannotBeRestricted) {
  writeUsualProfile();
  EXPECT_THAT(ending("test", {"seccomp"}), AllOf(HasSubstr("test.plist"), HasSubstr("seccomp")));
}

TEST_F(LinuxSandboxTest, AnOptionalProfileGoesOnWithAWarningForEachThingThatIsMissing) {
  writeProfile("<key>Optional</key><true/>");
  EXPECT_THAT(ending("test", {"landlock_create_ruleset"}),
              MatchesRegex("confined\n4 Sandbox profile .*/test.plist is not enforced: .*Landlock.*\n"));
  EXPECT_THAT(ending("test", {"landlock_create_ruleset", "seccomp"}),
              MatchesRegex("confined\n4 Sandbox .*Landlock.*\n4 Sandbox .*seccomp.*\n"));
}

TEST_F(LinuxSandboxTest, AnOptionalProfileIsEnforcedWhereItCanBe) {
  writeProfile("<key>Optional</key><true/>");
  EXPECT_EQ(confined([&] { return _log.lines + outcomeOfOpening(path("open/file"), O_RDONLY); }), "EACCES");
  EXPECT_EQ(
      inChild([&] {
        pretendTheKernelLacks({"landlock_create_ruleset"});
        static_cast<void>(_sandbox.sandbox_init("test"));
        return inTurn({outcomeOfOpening(path("open/file"), O_RDONLY), outcome(::unshare(CLONE_NEWUSER))});
      }),
      "ok EPERM")
      << "files stay open where only Landlock is missing";
}

TEST_F(LinuxSandboxTest, NamesTheHolesThatAProfileLeaves) {
  writeProfile(arrayOf("Read", {"system:/tmp"}) + arrayOf("Write", {"system:/dev/full"}),
               std::string(kAllCalls) + "<string>ptrace</string><string>fork</string>");
  const auto holes = confined([&] {
    std::string lines;
    for (const auto& hole : _sandbox.holes()) lines += hole + "\n";
    return lines;
  });
  EXPECT_EQ(holes, "read /tmp\nwrite to /dev/full\nstart a process (fork)\ntrace a process (ptrace)\n");
}

TEST_F(LinuxSandboxTest, TriesNothingThatAnOptionalProfileWentWithout) {
  writeProfile("<key>Optional</key><true/>");
  const auto holesWithout = [&](const std::vector<const char*>& lacking) {
    return inChild([&] {
      pretendTheKernelLacks(lacking);
      const auto error = _sandbox.sandbox_init("test");
      return error ? *error : std::to_string(_sandbox.holes().size());
    });
  };
  EXPECT_EQ(holesWithout({"landlock_create_ruleset"}), "0");
  EXPECT_EQ(holesWithout({"seccomp"}), "0");
}

std::string contents(const FileDescriptor& file) {
  if (!file) return outcome(-1);
  char bytes[64];
  const ssize_t length = ::read(file.get(), bytes, sizeof bytes);
  return length >= 0 ? std::string(bytes, static_cast<std::size_t>(length)) : outcome(-1);
}

class LinuxSandboxGrantTest : public LinuxSandboxTest {
 protected:
  std::string token(std::string_view relative) const { return "tally.file:" + path(relative).string(); }
  std::vector<FileDescriptor> opened(std::string_view relative) const {
    std::vector<FileDescriptor> descriptors;
    descriptors.emplace_back(::open(path(relative).c_str(), O_RDONLY | O_CLOEXEC));
    descriptors.emplace_back(::open(path(relative).parent_path().c_str(), O_PATH | O_CLOEXEC));
    return descriptors;
  }
};

TEST_F(LinuxSandboxGrantTest, OpensAForbiddenFileWhileItsGrantIsConsumed) {
  writeUsualProfile();
  auto descriptors = opened("shut/file");  // What a client outside the sandbox opened.
  EXPECT_EQ(confined([&] {
              const std::string file = path("shut/file").string();
              std::string seen = contents(_sandbox.openForReading(file));
              const auto grant = _sandbox.offerGrant(token("shut/file"), std::move(descriptors));
              const auto handle = _sandbox.sandbox_extension_consume(token("shut/file"));
              seen = inTurn(
                  {seen, contents(_sandbox.openForReading(file)), contents(_sandbox.openForReading(file))});
              _sandbox.sandbox_extension_release(handle);
              return inTurn({seen, contents(_sandbox.openForReading(file))});
            }),
            "EACCES shut shut EACCES");
}

TEST_F(LinuxSandboxGrantTest, AGrantForOneFileOpensNoOther) {
  writeUsualProfile();
  writeFile(path("shut/other"), "other");
  auto descriptors = opened("shut/file");
  EXPECT_EQ(confined([&] {
              const auto grant = _sandbox.offerGrant(token("shut/file"), std::move(descriptors));
              const auto handle = _sandbox.sandbox_extension_consume(token("shut/file"));
              std::string seen = inTurn({contents(_sandbox.openForReading(path("shut/other").string())),
                                         contents(_sandbox.openForReading(path("open/file").string()))});
              _sandbox.sandbox_extension_release(handle);
              return seen;
            }),
            "EACCES open");
}

TEST_F(LinuxSandboxGrantTest, WithoutASandboxFilesOpenAsTheyStand) {
  EXPECT_EQ(_sandbox.sandbox_extension_consume(token("shut/file")), Sandbox::kNoExtension);
  EXPECT_EQ(contents(_sandbox.openForReading(path("shut/file").string())), "shut");
  EXPECT_EQ(contents(_sandbox.openForReading(path("missing").string())), "ENOENT");
}

TEST_F(LinuxSandboxGrantTest, AGrantThatCannotBeReadIsNotPassedOver) {
  std::vector<FileDescriptor> descriptors;
  descriptors.emplace_back(::open(path("shut/file").c_str(), O_WRONLY | O_CLOEXEC));
  const auto grant = _sandbox.offerGrant(token("shut/file"), std::move(descriptors));
  const auto handle = _sandbox.sandbox_extension_consume(token("shut/file"));
  EXPECT_EQ(contents(_sandbox.openForReading(path("shut/file").string())), "EACCES");
  _sandbox.sandbox_extension_release(handle);
}

TEST_F(LinuxSandboxGrantTest, APipeHoldsNobodyUp) {
  ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
  EXPECT_EQ(contents(_sandbox.openForReading(path("pipe").string())), "");
}

}  // namespace
}  // namespace tallyd::platform
