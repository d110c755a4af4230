#include "ToolTest.h"

namespace tallyd::tallyctl {
namespace {

using SessionCommandsTest = ToolTest;

TEST_F(SessionCommandsTest, OnceSendsOneMessageWithItsSessionInfo) {
  EXPECT_EQ(run({"once", "--client-type", "7", "--session-id", "9", "--service-name", "s", "--batch",
                 "--category", "2", "--type", "4", "ok=true"}),
            kSucceeded);
  EXPECT_EQ(_out, "finished\n");
  const Value info = Dictionary{{"SessionID", 9}, {"ClientType", 7}, {"BatchEvent", true}};
  const Value user = Dictionary{{"ServiceName", "s"}};
  const Value payload = Dictionary{{"ok", true}};
  EXPECT_EQ(_daemon.calls(),
            (std::vector<ScriptedDaemon::Call>{
                {Method::SendMessageWithSessionInfo, {Array{info}, Array{user}, 2, 4, Array{payload}}}}));
}

TEST_F(SessionCommandsTest, OnceFailsWhenTheStorebagIsNotAvailable) {
  _daemon.script.onceReply = "storebag not available";
  EXPECT_EQ(run({"once", "--category", "2", "--type", "4"}), kFailed);
  EXPECT_EQ(_out, "storebag not available\n");
}

TEST_F(SessionCommandsTest, OnceGivesUpAfterTheTimeout) {
  _daemon.script.repliesToOnce = false;
  EXPECT_EQ(run({"--timeout", "0.1", "once", "--category", "2", "--type", "4"}), kFailed);
  EXPECT_TRUE(_err.starts_with("tallyctl: " + _socket.string() + ": the one-shot send failed: ")) << _err;
  EXPECT_EQ(_out, "");
}

TEST_F(SessionCommandsTest, StatesPrintsOneBackendALine) {
  EXPECT_EQ(run({"states", "--client-type", "6", "--client-name", "n"}), kSucceeded);
  EXPECT_EQ(_out, "https_post\ndashboard\n");
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[1],
            Value(Array{Dictionary{{"ClientName", "n"}}}));
  EXPECT_TRUE(_daemon.callsOf(Method::FetchStates).empty());
}

TEST_F(SessionCommandsTest, StatesTellsNoStorebagFromNoBackend) {
  _daemon.script.states = std::nullopt;
  EXPECT_EQ(run({"states"}), kSucceeded);
  EXPECT_EQ(_out, "no storebag\n");
  _daemon.script.states.emplace();
  EXPECT_EQ(run({"states"}), kSucceeded);
  EXPECT_EQ(_out, "");
  EXPECT_EQ(_err, "no backend reports\n");
}

TEST_F(SessionCommandsTest, StatesWaitsForUserInfoOnTheStandardInput) {
  _daemon.script.states.emplace();
  EXPECT_EQ(run({"states", "--require-user-info", "--wait-for-user-info", "--client-name", "old",
                 "--service-name", "s"},
                "ClientName=new\n\nage:=\"7\"\n"),
            kSucceeded);
  EXPECT_EQ(_out, "https_post\n");
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[1], Value(Array()));
  const Value user = Dictionary{{"ClientName", "new"}, {"ServiceName", "s"}, {"age", "7"}};
  EXPECT_EQ(_daemon.callsOf(Method::FetchStates)[0].arguments, (std::vector<Value>{Array{user}}));
}

TEST_F(SessionCommandsTest, StatesNamesTheLineThatIsNoUserInfo) {
  EXPECT_EQ(run({"states", "--wait-for-user-info"}, "a=1\nb\n"), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard input:2: \"b\" is neither KEY=VALUE nor KEY:=JSON\n");
}

TEST_F(SessionCommandsTest, FlushPrintsTheResult) {
  _daemon.script.flushResult = "nothing to post";
  EXPECT_EQ(run({"flush"}), kSucceeded);
  EXPECT_EQ(_out, "nothing to post\n");
  _daemon.script.flushResult = std::nullopt;
  EXPECT_EQ(run({"flush"}), kSucceeded);
  EXPECT_EQ(_out, "no result\n");
}

TEST_F(SessionCommandsTest, FlushFailsWithoutAStorebag) {
  _daemon.script.states = std::nullopt;
  EXPECT_EQ(run({"flush", "--client-type", "9"}), kFailed);
  EXPECT_EQ(_out, "no result\n");
  EXPECT_EQ(_err, "tallyctl: the daemon has no storebag for client type 9: messages reach no backend\n");
}

TEST_F(SessionCommandsTest, DisplayURLPrintsTheURL) {
  _daemon.script.displayURL = "https://show.example/?sequences=9&override=yes";
  EXPECT_EQ(run({"display-url", "--session-id", "9"}), kSucceeded);
  EXPECT_EQ(_out, "https://show.example/?sequences=9&override=yes\n");
  const Value info = Dictionary{{"SessionID", 9}, {"ClientType", 5}};
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[0], Value(Array{info}));
  EXPECT_EQ(run({"display-url", "--json"}), kSucceeded);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"ok", true}, {"url", _daemon.script.displayURL}}}));
}

TEST_F(SessionCommandsTest, DisplayURLFailsWhenThereIsNone) {
  EXPECT_EQ(run({"display-url"}), kFailed);
  EXPECT_EQ(_out, "");
  EXPECT_EQ(_err, "tallyctl: URL not available\n");
  EXPECT_EQ(run({"--json", "display-url"}), kFailed);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"ok", false}, {"error", "URL not available"}}}));
}

TEST_F(SessionCommandsTest, PrintResultsAsObjects) {
  EXPECT_EQ(run({"--json", "once", "--category", "2", "--type", "4"}), kSucceeded);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"ok", true}, {"reply", "finished"}}}));
  EXPECT_EQ(run({"--json", "states"}), kSucceeded);
  EXPECT_EQ(objects(),
            (std::vector<Dictionary>{{{"ok", true}, {"states", Array{"https_post", "dashboard"}}}}));
  EXPECT_EQ(run({"--json", "states", "--wait-for-user-info"}, "a=1\n"), kSucceeded);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"states", Array{"https_post", "dashboard"}}},
                                                {{"ok", true}, {"states", Array{"https_post"}}}}));
  EXPECT_EQ(run({"--json", "flush"}), kSucceeded);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"ok", true}, {"result", nullptr}}}));
}

TEST_F(SessionCommandsTest, PrintFailuresAsObjects) {
  _daemon.script.onceReply = "storebag not available";
  EXPECT_EQ(run({"--json", "once", "--category", "2", "--type", "4"}), kFailed);
  EXPECT_EQ(objects(),
            (std::vector<Dictionary>{
                {{"ok", false}, {"reply", "storebag not available"}, {"error", "storebag not available"}}}));
  _daemon.script.states = std::nullopt;
  _daemon.script.flushResult = "nothing";
  EXPECT_EQ(run({"--json", "states"}), kSucceeded);
  EXPECT_EQ(objects(), (std::vector<Dictionary>{{{"ok", true}, {"states", nullptr}}}));
  EXPECT_EQ(run({"--json", "flush"}), kFailed);
  ASSERT_EQ(objects().size(), 1U);
  EXPECT_EQ(objects()[0].string("result"), "nothing");
  EXPECT_EQ("tallyctl: " + std::string(objects()[0].string("error").value_or("")) + "\n", _err);
  _socket = _folder.path() / "other";
  EXPECT_EQ(run({"--json", "states"}), kFailed);
  ASSERT_EQ(objects().size(), 1U);
  EXPECT_FALSE(objects()[0].boolean("ok"));
  EXPECT_EQ("tallyctl: " + std::string(objects()[0].string("error").value_or("")) + "\n", _err);
}

TEST_F(SessionCommandsTest, FailWhenTheOutputTakesNothing) {
  FailingOutput full(0, ENOSPC);
  std::ostream fullOut(&full);
  EXPECT_EQ(runInto(fullOut, {"states"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard output: No space left on device\n");
  EXPECT_EQ(runInto(fullOut, {"--version"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard output: does not take what is written\n");
  FailingOutput version(0, ENOSPC);
  std::ostream versionOut(&version);
  EXPECT_EQ(runInto(versionOut, {"--version"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard output: No space left on device\n");
  FailingOutput closed(0, EPIPE);
  std::ostream closedOut(&closed);
  EXPECT_EQ(runInto(closedOut, {"--help"}), kClosedPipe);
  EXPECT_EQ(_err, "");
}

}  // namespace
}  // namespace tallyd::tallyctl
