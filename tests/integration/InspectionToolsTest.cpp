// The daemon's books and its tap through programs: tallyctl and busctl.

#include <gtest/gtest.h>

#include <csignal>

#include "integration/InspectionFixture.h"

namespace tallyd::test {
namespace {

class InspectionToolsTest : public InspectionFixture {
 protected:
  [[nodiscard]] WatchedProcess::Options tallyctl(std::vector<std::string> arguments) const {
    arguments.insert(arguments.begin(),
                     {TALLYD_BIN_DIR "/tallyctl", "--root", root.root().directory().string()});
    return {.arguments = std::move(arguments)};
  }
};

TEST_F(InspectionToolsTest, TallyctlShowsBooksThatBalance) {
  TestDaemon daemon(root);
  const auto session = startedSession(daemon, sessionInfo(42));
  for (int i = 0; i < 3; ++i) session->sendMessageSync(4, 0, Dictionary{{"refuse", i == 0}});
  ASSERT_TRUE(collector.waitForRequests(4));
  TallyInspection inspection(inspectionSocket());
  statsWhen(inspection, [](const auto& stats) {
    return number(rowOf(*stats.dictionary("total"), "splunk"), "sent") == 4;
  });
  WatchedProcess stats(tallyctl({"stats"}));
  EXPECT_EQ(stats.wait().code, 0);
  const auto lines = stats.lines();
  ASSERT_GE(lines.size(), 6U) << stats.output();
  EXPECT_EQ(lines[0], "connections: 1 open, 1 accepted");
  EXPECT_EQ(lines[2], "session 1 (ID 42, client type 5, demo)");
  EXPECT_EQ(lines[3],
            "  messages             offered             3         3         0         0         0         0");
  EXPECT_EQ(lines[4],
            "  splunk               https-post          4         4         1         0         0         0");
  EXPECT_EQ(lines.back(), "balance: exact");

  WatchedProcess json(tallyctl({"--json", "stats"}));
  EXPECT_EQ(json.wait().code, 0);
  const Dictionary object = parsed(json.lines().at(0));
  EXPECT_TRUE(object.boolean("ok"));
  EXPECT_TRUE(object.array("imbalances")->empty());
  EXPECT_EQ(number(rowOf(*object.dictionary("total"), "splunk"), "refused"), 1);
}

TEST_F(InspectionToolsTest, TallyctlTapsUntilItIsStopped) {
  TestDaemon daemon(root);
  WatchedProcess text(tallyctl({"tap"}));
  WatchedProcess json(tallyctl({"--json", "tap"}));
  ASSERT_TRUE(text.waitForLineStartingWith("listening at "));
  ASSERT_TRUE(json.waitForLineStartingWith("listening at "));
  const auto session = startedSession(daemon, sessionInfo(42));
  EXPECT_TRUE(json.waitForLineStartingWith("{\"time\":"));
  text.signal(SIGTERM);
  json.signal(SIGINT);
  EXPECT_EQ(text.wait().code, 0);
  EXPECT_EQ(json.wait().code, 0);
  EXPECT_EQ(json.lines().back(), "{\"ok\":true}");
  for (const auto& line : json.lines()) {
    if (!line.starts_with("{\"time\"")) continue;
    EXPECT_EQ(parsed(line).string("kind"), "post");
  }
}

TEST_F(InspectionToolsTest, TallyctlFailsWhenTheDaemonGoes) {
  auto daemon = std::make_unique<TestDaemon>(root);
  WatchedProcess tap(tallyctl({"tap"}));
  ASSERT_TRUE(tap.waitForLineStartingWith("listening at "));
  daemon = nullptr;
  EXPECT_EQ(tap.wait().code, 1);
  EXPECT_NE(tap.output().find("the daemon closed the connection"), std::string::npos) << tap.output();
  WatchedProcess stats(tallyctl({"stats"}));
  EXPECT_EQ(stats.wait().code, 1);
}

TEST_F(InspectionToolsTest, BusctlCallsStats) {
  TestDaemon daemon(root);
  WatchedProcess busctl(
      {.arguments = {"/usr/bin/busctl", "--address=unix:path=" + inspectionSocket().string(), "call",
                     "com.quillon.tallyd", "/com/quillon/tallyd", "com.quillon.tallyd.InspectionInterface",
                     "Stats"}});
  EXPECT_EQ(busctl.wait().code, 0) << busctl.output();
  EXPECT_TRUE(busctl.output().starts_with("a{sv} 5 \"connections\" a{sv} 2 ")) << busctl.output();
}

}  // namespace
}  // namespace tallyd::test
