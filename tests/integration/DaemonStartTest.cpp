// Starting the daemon: options, sandbox, readiness, one daemon a root.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <csignal>
#include <fstream>

#include "framework/ClientSessionInterface.h"
#include "integration/TestDaemon.h"
#include "support/RawServer.h"

namespace tallyd::test {
namespace {

class DaemonStartTest : public testing::Test {
 protected:
  StorebagServer server;
  TestRoot root{server};

  static WatchedProcess run(std::vector<std::string> arguments,
                            std::map<std::string, std::string> environment = {}) {
    arguments.insert(arguments.begin(), TestDaemon::program());
    return WatchedProcess({.arguments = std::move(arguments), .environment = std::move(environment)});
  }
  std::vector<std::string> rootArguments() const {
    return {"--root", root.root().directory().string(), "--log", "stderr"};
  }
};

TEST_F(DaemonStartTest, ShowsHelpWithAnExample) {
  auto process = run({"--help"});
  EXPECT_EQ(process.wait().code, 0);
  EXPECT_NE(process.output().find("--root"), std::string::npos);
  EXPECT_NE(process.output().find("Example"), std::string::npos);
}

TEST_F(DaemonStartTest, ShowsItsVersion) {
  auto process = run({"--version"});
  EXPECT_EQ(process.wait().code, 0);
  EXPECT_TRUE(process.output().starts_with("tallyd ")) << process.output();
}

TEST_F(DaemonStartTest, RefusesWhatItDoesNotKnow) {
  for (const auto& arguments : std::vector<std::vector<std::string>>{
           {"--nonsense"}, {"--log", "nowhere"}, {"--log-level", "loud"}, {"--root", "/nowhere/at/all"}}) {
    auto process = run(arguments);
    EXPECT_EQ(process.wait().code, 2) << arguments[0];
    EXPECT_NE(process.output(), "");
  }
}

TEST_F(DaemonStartTest, ListensInItsSandboxAndTellsTheServiceManager) {
  TestDaemon daemon(root);
  EXPECT_TRUE(daemon.process().waitForLine("<6>Listener resumes with sandbox, start loop."));
  struct stat facts {};
  ASSERT_EQ(stat(root.socket().c_str(), &facts), 0);
  EXPECT_TRUE(S_ISSOCK(facts.st_mode));
  EXPECT_EQ(facts.st_mode & 0777U, 0666U);
  const std::string status = [&] {
    std::ifstream file("/proc/" + std::to_string(daemon.process().pid()) + "/status");
    return std::string(std::istreambuf_iterator<char>(file), {});
  }();
  EXPECT_NE(status.find("NoNewPrivs:\t1"), std::string::npos);
  EXPECT_NE(status.find("Seccomp:\t2"), std::string::npos);
}

TEST_F(DaemonStartTest, ExitsWhenTheSandboxCannotBeEntered) {
  std::filesystem::remove(root.under("/usr/share/tally/sandbox/com.quillon.tallyd.plist"));
  auto process = run(rootArguments());
  EXPECT_EQ(process.wait().code, 255);
  EXPECT_TRUE(process.waitForLineStartingWith("<3>sandbox_init() fails: ")) << process.output();
  EXPECT_FALSE(std::filesystem::exists(root.socket()));
}

TEST_F(DaemonStartTest, RunsWithoutASandboxWhenToldTo) {
  std::filesystem::remove(root.under("/usr/share/tally/sandbox/com.quillon.tallyd.plist"));
  TestDaemon daemon(root, {.arguments = {"--no-sandbox"}});
  EXPECT_TRUE(daemon.process().waitForLine("<4>Running without a sandbox."));
  EXPECT_EQ(daemon.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
}

TEST_F(DaemonStartTest, TakesTheRootFromTheEnvironment) {
  auto process = run({"--log", "stderr"}, {{"TALLY_ROOT", root.root().directory().string()}});
  EXPECT_TRUE(process.waitForLine("<6>Listener resumes with sandbox, start loop."));
  EXPECT_TRUE(std::filesystem::exists(root.socket()));
}

TEST_F(DaemonStartTest, LeavesOutLinesAboveTheLogLevel) {
  TestDaemon daemon(root, {.arguments = {"--log-level", "6"}});
  daemon.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt);
  daemon.process().signal(SIGTERM);
  daemon.process().wait();
  for (const auto& line : daemon.process().lines()) EXPECT_FALSE(line.starts_with("<7>")) << line;
}

TEST_F(DaemonStartTest, RefusesToStartBesideAnotherOnTheSameRoot) {
  TestDaemon first(root);
  auto second = run(rootArguments());
  EXPECT_EQ(second.wait().code, 1);
  EXPECT_TRUE(
      second.waitForLineStartingWith("<2>tallyd can't start: another tallyd is running on this root: "))
      << second.output();
  EXPECT_EQ(first.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
}

TEST_F(DaemonStartTest, ReplacesTheSocketOfADaemonThatDied) {
  {
    TestDaemon first(root);
    first.process().signal(SIGKILL);
    first.process().wait();
  }
  ASSERT_TRUE(std::filesystem::exists(root.socket()));
  TestDaemon second(root);
  EXPECT_EQ(second.connect()->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
}

TEST_F(DaemonStartTest, TakesASocketThatTheServiceManagerPasses) {
  fakes::TemporaryFolder elsewhere;
  const auto path = elsewhere.path() / "passed";
  const platform::FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  ASSERT_EQ(bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(listen(listener.get(), 16), 0);
  TestDaemon daemon(root, {.passedSocket = listener.get()});
  TallyConnection connection(path);
  EXPECT_EQ(connection.setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
  EXPECT_FALSE(std::filesystem::exists(root.socket()));
}

TEST_F(DaemonStartTest, GoesOnWhenPreferencesCannotBeRead) {
  root.write("/etc/tally/preferences/com.quillon.tally.plist", "this is {{{ no property list");
  TestDaemon daemon(root);
  auto connection = daemon.connect();
  connection->setSessionInfoSync(sessionInfo(1), std::nullopt);
  EXPECT_EQ(connection->startConfigSync().error, std::nullopt);  // Asks for the storebag's URL.
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<3>")) << daemon.process().output();
  EXPECT_NE(daemon.process().output().find("com.quillon.tally.plist"), std::string::npos);
}

}  // namespace
}  // namespace tallyd::test
