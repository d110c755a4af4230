// The profile that ships with the daemon, in force.

#include <arpa/inet.h>
#include <dlfcn.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/timerfd.h>
#include <sys/un.h>

#include <ctime>
#include <thread>

#include "SandboxTestSupport.h"
#include "platform/sandbox/LinuxSandbox.h"
#include "platform/sandbox/SandboxProfile.h"

namespace tallyd::platform {
namespace {

constexpr const char* kName = "com.quillon.tallyd";

class DaemonProfileTest : public testing::Test {
 protected:
  void SetUp() override {
    const auto folder = path("usr/share/tally/sandbox");
    std::filesystem::create_directories(folder);
    std::filesystem::copy(TALLYD_SOURCE_DIR "/packaging/sandbox/com.quillon.tallyd.plist", folder);
    writeFile(path("etc/tally/device.plist"), "settings");
    writeFile(path("home/secret"), "secret");
  }

  std::filesystem::path path(std::string_view relative) const { return _folder.path() / relative; }

  std::string confined(const std::function<std::string()>& body) {
    return inChild([&]() -> std::string {
      const auto error = _sandbox.sandbox_init(kName);
      return error ? "not confined: " + *error : body() + _log.lines;
    });
  }

  const TemporaryFolder _folder;
  const Root _root{_folder.path()};
  KeptLog _log;
  LinuxSandbox _sandbox{_root, _log};
};

sockaddr_un unixAddress(const std::filesystem::path& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

sockaddr_in loopback() {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  return address;
}

template <class Address>
sockaddr* general(Address& address) {
  return reinterpret_cast<sockaddr*>(&address);
}

TEST_F(DaemonProfileTest, ReadsSettingsAndWritesOwnFiles) {
  EXPECT_EQ(
      confined([&] {
        std::error_code error;
        const auto logs = path("var/mobile/Library/Logs/CrashReporter/Retired");
        std::filesystem::create_directories(logs, error);
        return inTurn({outcomeOfOpening(path("etc/tally/device.plist"), O_RDONLY),
                       outcomeOfOpening(path("var/lib/tallyd/defaults"), O_RDWR | O_CREAT),
                       outcomeOfOpening(path("var/log/tallyd/power.jsonl"), O_WRONLY | O_APPEND | O_CREAT),
                       outcomeOfOpening(logs / "line", O_WRONLY | O_CREAT),
                       outcome(::unlink((logs / "line").c_str()))});
      }),
      "ok ok ok ok ok");
}

TEST_F(DaemonProfileTest, KeepsOtherFilesOutOfReach) {
  EXPECT_EQ(confined([&] {
              return inTurn({outcomeOfOpening(path("home/secret"), O_RDONLY),
                             outcomeOfOpening(path("etc/tally/device.plist"), O_WRONLY),
                             outcomeOfOpening(path("etc/tally/new"), O_WRONLY | O_CREAT),
                             outcomeOfOpening("/etc/tallyd-test", O_WRONLY | O_CREAT),
                             outcomeOfOpening("/root", O_RDONLY)});
            }),
            "EACCES EACCES EACCES EACCES EACCES");
}

TEST_F(DaemonProfileTest, AcceptsOnASocketThatItTookBefore) {
  const auto place = path("run/tallyd/com.quillon.tallyd");
  std::filesystem::create_directories(place.parent_path());
  auto address = unixAddress(place);
  const FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(listener.get(), general(address), sizeof address), 0);
  ASSERT_EQ(::listen(listener.get(), 5), 0);
  const FileDescriptor client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::connect(client.get(), general(address), sizeof address), 0);
  EXPECT_EQ(confined([&] {
              const FileDescriptor accepted(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
              return inTurn({outcome(accepted.get()), outcome(::unlink(place.c_str()))});
            }),
            "ok ok");
}

TEST_F(DaemonProfileTest, ListensOnNoNewSocket) {
  EXPECT_EQ(confined([&] {
              auto unixPlace = unixAddress(path("run/tallyd/other"));
              const FileDescriptor local(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
              const FileDescriptor network(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
              return inTurn({outcome(::bind(local.get(), general(unixPlace), sizeof unixPlace)),
                             outcome(::listen(local.get(), 1)), outcome(::listen(network.get(), 1))});
            }),
            "EACCES EPERM EPERM");
}

TEST_F(DaemonProfileTest, SpeaksTCPAndUDP) {
  auto server = loopback();
  socklen_t length = sizeof server;
  const FileDescriptor listener(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(listener.get(), general(server), sizeof server), 0);
  ASSERT_EQ(::listen(listener.get(), 1), 0);
  ASSERT_EQ(::getsockname(listener.get(), general(server), &length), 0);
  EXPECT_EQ(confined([&] {
              const FileDescriptor client(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
              std::string seen = inTurn({outcome(::connect(client.get(), general(server), sizeof server)),
                                         outcome(::send(client.get(), "x", 1, MSG_NOSIGNAL))});
              auto any = loopback();
              const FileDescriptor datagrams(::socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
              length = sizeof any;
              seen = inTurn({seen, outcome(::bind(datagrams.get(), general(any), sizeof any)),
                             outcome(::getsockname(datagrams.get(), general(any), &length)),
                             outcome(::sendto(datagrams.get(), "y", 1, 0, general(any), sizeof any))});
              return seen;
            }),
            "ok ok ok ok ok");
}

TEST_F(DaemonProfileTest, AsksForItsLimitsAndChangesNone) {
  EXPECT_EQ(confined([] {
              rlimit limit{};
              return inTurn(
                  {outcome(::getrlimit(RLIMIT_NOFILE, &limit)), outcome(::setrlimit(RLIMIT_NOFILE, &limit))});
            }),
            "ok EPERM");
}

TEST_F(DaemonProfileTest, LeavesNoHoles) {
  EXPECT_EQ(confined([&] {
              std::string holes;
              for (const auto& hole : _sandbox.holes()) holes += hole + "\n";
              return holes;
            }),
            "");
}

TEST_F(DaemonProfileTest, LooksUpNames) {
  EXPECT_EQ(confined([] {
              addrinfo* found = nullptr;
              addrinfo hints{};
              hints.ai_socktype = SOCK_STREAM;
              const int error = ::getaddrinfo("localhost", "80", &hints, &found);
              if (found) ::freeaddrinfo(found);
              return std::string(error ? ::gai_strerror(error) : "ok");
            }),
            "ok");
}

TEST_F(DaemonProfileTest, RunsThreadsTimersAndEvents) {
  EXPECT_EQ(confined([] {
              const FileDescriptor timer(::timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK));
              const itimerspec soon{{0, 0}, {0, 1'000'000}};
              const FileDescriptor event(::eventfd(0, EFD_CLOEXEC));
              const FileDescriptor epoll(::epoll_create1(EPOLL_CLOEXEC));
              epoll_event interest{};
              interest.events = EPOLLIN;
              std::string seen =
                  inTurn({outcome(::timerfd_settime(timer.get(), 0, &soon, nullptr)), outcome(event.get()),
                          outcome(::epoll_ctl(epoll.get(), EPOLL_CTL_ADD, timer.get(), &interest))});
              std::thread([&] {
                epoll_event arrived{};
                seen += " " + std::to_string(::epoll_wait(epoll.get(), &arrived, 1, 10'000));
              }).join();
              return seen;
            }),
            "ok ok ok 1");
}

TEST_F(DaemonProfileTest, SendsLargeLogLinesThroughSealedMemory) {
  EXPECT_EQ(confined([] {
              const FileDescriptor memory(::memfd_create("line", MFD_CLOEXEC | MFD_ALLOW_SEALING));
              return inTurn(
                  {outcome(memory.get()), outcome(::write(memory.get(), "x", 1)),
                   outcome(::fcntl(memory.get(), F_ADD_SEALS, F_SEAL_WRITE | F_SEAL_SHRINK | F_SEAL_GROW))});
            }),
            "ok ok ok");
}

TEST_F(DaemonProfileTest, LoadsLibraries) {
  EXPECT_EQ(confined([]() -> std::string {
              // One that this program does not use already, from the system's library folder.
              void* library = ::dlopen("libBrokenLocale.so.1", RTLD_NOW | RTLD_LOCAL);
              if (!library) return ::dlerror();
              ::dlclose(library);
              return "ok";
            }),
            "ok");
}

TEST_F(DaemonProfileTest, LearnsFactsAboutTheDevice) {
  EXPECT_EQ(
      confined([] {
        return inTurn({outcomeOfOpening("/etc/os-release", O_RDONLY), outcomeOfOpening("/sys", O_RDONLY),
                       outcomeOfOpening("/proc/self/maps", O_RDONLY),
                       outcomeOfOpening("/proc/sys/kernel/osrelease", O_RDONLY),
                       outcomeOfOpening("/proc/1/environ", O_RDONLY)});
      }),
      "ok ok ok ok EACCES");
}

TEST_F(DaemonProfileTest, StartsNoPrograms) {
  char name[] = "true";
  char* arguments[] = {name, nullptr};
  EXPECT_EQ(confined([&] { return outcome(::execve("/usr/bin/true", arguments, nullptr)); }), "EPERM");
}

TEST_F(DaemonProfileTest, IsNotOptional) {
  std::ifstream file(TALLYD_SOURCE_DIR "/packaging/sandbox/com.quillon.tallyd.plist");
  const std::string bytes{std::istreambuf_iterator<char>(file), {}};
  EXPECT_FALSE(sandboxProfileWithData(bytes, _root).optional);
}

}  // namespace
}  // namespace tallyd::platform
