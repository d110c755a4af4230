#include <fmt/format.h>
#include <gmock/gmock.h>

#include <algorithm>
#include <future>

#include "CuttableRelay.h"
#include "ToolTest.h"
#include "tallyctl/MessageSender.h"
#include "tallyctl/Session.h"

namespace tallyd::tallyctl {
namespace {

class ReportCommandTest : public ToolTest {
 protected:
  [[nodiscard]] std::vector<Method> methods() const {
    std::vector<Method> methods;
    for (const auto& call : _daemon.calls()) methods.push_back(call.method);
    return methods;
  }
};

TEST_F(ReportCommandTest, ConfiguresStartsSendsAndFlushes) {
  _daemon.script.sendResult = [](auto) { return "posted"; };
  _daemon.script.flushResult = "flushed 1 event";
  EXPECT_EQ(run({"report", "--session-id", "7", "--client-version", "2", "--client-name", "demo",
                 "--framework", "F", "--category", "1", "--type", "300", "rtt=12.5", "codec=opus"}),
            kSucceeded);
  EXPECT_EQ(_out,
            "session 7\nstates: https_post, dashboard\nmessage: posted\nflush: flushed 1 event\n"
            "sent 1 messages, 0 failed\n");
  EXPECT_EQ(_err, "");
  const Value info = Dictionary{{"SessionID", 7}, {"ClientType", 5}, {"ClientVersion", 2}};
  const Value user = Dictionary{{"ClientName", "demo"}};
  const Value payload = Dictionary{{"rtt", 12.5}, {"codec", "opus"}};
  EXPECT_EQ(_daemon.calls(), (std::vector<ScriptedDaemon::Call>{
                                 {Method::SetSessionInfo, {Array{info}, Array{user}, Array{"F"}}},
                                 {Method::StartConfig, {}},
                                 {Method::SendMessageWithCategory, {1, 300, Array{payload}}},
                                 {Method::FlushMessages, {}}}));
}

TEST_F(ReportCommandTest, SendsNothingForWhatIsNotSaid) {
  EXPECT_EQ(run({"report", "--session-id", "7", "--category", "1", "--type", "2"}), kSucceeded);
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[1], Value(Array()));
  EXPECT_EQ(_daemon.callsOf(Method::SendMessageWithCategory)[0].arguments[2], Value(Array()));
  EXPECT_EQ(_out, "session 7\nstates: https_post, dashboard\nsent 1 messages, 0 failed\n");
}

TEST_F(ReportCommandTest, FlushesAfterEverySoManyMessages) {
  const std::string line = "{\"category\":1,\"type\":2}\n";
  EXPECT_EQ(run({"report", "--messages", "-", "--flush-every", "2"}, line + line + line), kSucceeded);
  EXPECT_EQ(methods(),
            (std::vector<Method>{Method::SetSessionInfo, Method::StartConfig, Method::SendMessageWithCategory,
                                 Method::SendMessageWithCategory, Method::FlushMessages,
                                 Method::SendMessageWithCategory, Method::FlushMessages}));
}

TEST_F(ReportCommandTest, NamesFaultyLinesAndGoesOn) {
  _daemon.script.sendResult = [](auto type) {
    return type == 3 ? std::optional<std::string>("three") : std::nullopt;
  };
  EXPECT_EQ(run({"report", "--messages", "-"},
                "{\"category\":1,\"type\":2}\nnonsense\n\n{\"category\":1,\"type\":3}\n{\"type\":1}\n"),
            kFailed);
  EXPECT_EQ(messages(), (std::vector<Value>{message(1, 2), message(1, 3)}));
  EXPECT_NE(_out.find("standard input:4: three\n"), std::string::npos) << _out;
  EXPECT_NE(_out.find("sent 2 messages, 2 failed\n"), std::string::npos) << _out;
  EXPECT_NE(_err.find("tallyctl: standard input:2: Invalid value."), std::string::npos) << _err;
  EXPECT_NE(_err.find("tallyctl: standard input:5: \"category\" is missing\n"), std::string::npos) << _err;
}

TEST_F(ReportCommandTest, StopsAtTheFirstFaultyLineWhenStrict) {
  EXPECT_EQ(run({"report", "--strict", "--messages", "-"},
                "{\"category\":1,\"type\":2}\nnonsense\n{\"category\":1,\"type\":3}\n"),
            kFailed);
  EXPECT_EQ(messages(), (std::vector<Value>{message(1, 2)}));
  EXPECT_NE(_out.find("sent 1 messages, 1 failed\n"), std::string::npos) << _out;
}

TEST_F(ReportCommandTest, CountsAMessageThatGotAnErrorAsFailed) {
  _daemon.script.rejects = [](auto type) { return type == 3; };
  EXPECT_EQ(run({"report", "--messages", "-"},
                "{\"category\":1,\"type\":2}\n{\"category\":1,\"type\":3}\n{\"category\":1,\"type\":4}\n"),
            kFailed);
  EXPECT_NE(_out.find("sent 2 messages, 1 failed\n"), std::string::npos) << _out;
  EXPECT_TRUE(_err.starts_with("tallyctl: standard input:2: ")) << _err;
  EXPECT_NE(_err.find("rejected"), std::string::npos) << _err;
}

TEST_F(ReportCommandTest, SendsALongInputInOrder) {
  constexpr int kCount = 5000;
  std::string input;
  std::vector<Value> expected;
  for (int i = 0; i < kCount; ++i) {
    input += fmt::format("{{\"category\":1,\"type\":{},\"payload\":{{\"i\":{}}}}}\n", i, i);
    expected.push_back(message(1, i));
  }
  EXPECT_EQ(run({"report", "--messages", "-"}, input), kSucceeded);
  EXPECT_EQ(messages(), expected);
  EXPECT_NE(_out.find("sent 5000 messages, 0 failed\n"), std::string::npos) << _out;
}

TEST_F(ReportCommandTest, WaitsWhileTheWindowIsFull) {
  _daemon.script.holdsMessages = true;
  Session session({_socket});
  MessageSender sender(session.connection(), [](const auto&) {});
  for (std::size_t i = 0; i < MessageSender::kWindow; ++i) sender.send(i, Message{1, 1, std::nullopt});
  EXPECT_EQ(sender.totals().sent, 0U);
  std::promise<void> started;
  auto answeredBeforeReturn = std::async(std::launch::async, [&] {
    started.set_value();
    sender.send(MessageSender::kWindow, Message{1, 1, std::nullopt});
    return sender.totals().sent;
  });
  started.get_future().wait();
  session.connection().fetchStatesSync(std::nullopt);
  EXPECT_GE(answeredBeforeReturn.get(), 1U);
  session.connection().fetchStatesSync(std::nullopt);
  EXPECT_EQ(sender.drain().sent, MessageSender::kWindow + 1);
}

TEST_F(ReportCommandTest, SaysWhenThereIsNoStorebag) {
  _daemon.script.states = std::nullopt;
  EXPECT_EQ(run({"report", "--session-id", "7", "--client-type", "6", "--category", "1", "--type", "2"}),
            kFailed);
  EXPECT_EQ(_out, "session 7\nstates: no storebag\nsent 1 messages, 0 failed\n");
  EXPECT_EQ(_err, "tallyctl: the daemon has no storebag for client type 6: messages reach no backend\n");
}

TEST_F(ReportCommandTest, NamesTheFileThatItCannotOpenBeforeItConnects) {
  EXPECT_EQ(run({"report", "--messages", "/nonexistent/file"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: /nonexistent/file: No such file or directory\n");
  EXPECT_TRUE(_daemon.calls().empty());
}

TEST_F(ReportCommandTest, RefusesAFolderOfMessagesBeforeItConnects) {
  EXPECT_EQ(run({"report", "--messages", _folder.path().string()}), kFailed);
  EXPECT_EQ(_err, "tallyctl: " + _folder.path().string() + ": Is a directory\n");
  EXPECT_TRUE(_daemon.calls().empty());
}

TEST_F(ReportCommandTest, TellsEverythingAsObjects) {
  _daemon.script.sendResult = [](auto) { return "posted"; };
  _daemon.script.flushResult = "flushed";
  EXPECT_EQ(run({"--json", "report", "--session-id", "7", "--messages", "-"},
                "{\"category\":1,\"type\":2}\n{\"type\":1}\n"),
            kFailed);
  // The faulty line may be told before or after the first message's answer.
  EXPECT_THAT(
      objects(),
      testing::UnorderedElementsAre(
          Dictionary{{"session", 7}, {"states", Array{"https_post", "dashboard"}}},
          Dictionary{{"subject", "standard input:1"}, {"result", "posted"}},
          Dictionary{{"subject", "standard input:2"}, {"error", "\"category\" is missing"}},
          Dictionary{{"subject", "flush"}, {"result", "flushed"}},
          Dictionary{{"ok", false}, {"sent", 1}, {"failed", 1}, {"error", "1 messages, 0 flushes failed"}}));
  EXPECT_TRUE(objects().front().contains("session"));
  EXPECT_TRUE(objects().back().contains("ok"));
}

TEST_F(ReportCommandTest, EndsWithAnObjectThatSaysThatAllWentWell) {
  EXPECT_EQ(run({"report", "--json", "--category", "1", "--type", "2"}), kSucceeded);
  EXPECT_EQ(objects().back(), (Dictionary{{"ok", true}, {"sent", 1}, {"failed", 0}}));
  _daemon.script.states = std::nullopt;
  EXPECT_EQ(run({"report", "--json", "--category", "1", "--type", "2"}), kFailed);
  EXPECT_FALSE(objects().back().boolean("ok"));
  EXPECT_EQ(objects().back().string("error"),
            "the daemon has no storebag for client type 5: messages reach no backend");
}

TEST_F(ReportCommandTest, SendsEverythingThoughNobodyReadsItsOutput) {
  FailingOutput output(0, EPIPE);
  std::ostream out(&output);
  const std::string line = "{\"category\":1,\"type\":2}\n";
  EXPECT_EQ(runInto(out, {"report", "--messages", "-"}, line + line + line), kClosedPipe);
  EXPECT_EQ(messages().size(), 3U);
  EXPECT_EQ(_err, "");
}

TEST_F(ReportCommandTest, NamesTheSocketThatItCannotConnectTo) {
  _socket = _folder.path() / "other";
  EXPECT_EQ(run({"report", "--category", "1", "--type", "2"}), kFailed);
  EXPECT_NE(_err.find((_folder.path() / "other: ").string()), std::string::npos) << _err;
}

TEST_F(ReportCommandTest, NamesTheSocketWhoseServiceSendsItAway) {
  _daemon.script.refusesClients = true;
  EXPECT_EQ(run({"report", "--category", "1", "--type", "2"}), kFailed);
  EXPECT_TRUE(_err.starts_with("tallyctl: " + _socket.string() + ": configuring the session failed: "))
      << _err;
  EXPECT_EQ(_out, "");
}

TEST_F(ReportCommandTest, StopsReadingWhenTheDaemonIsGone) {
  constexpr std::size_t kLines = 50'000;
  constexpr std::uint16_t kLast = 200;
  std::string input;
  for (std::size_t i = 0; i < kLines; ++i)
    input += fmt::format("{{\"category\":1,\"type\":{}}}\n", i % 60'000);
  const auto relaySocket = _folder.path() / "relay";
  CuttableRelay relay(relaySocket, std::exchange(_socket, relaySocket));
  _daemon.script.sendResult = [&relay](auto type) {
    if (type == kLast) relay.cut();
    return std::nullopt;
  };
  EXPECT_EQ(run({"report", "--messages", "-"}, input), kFailed);
  EXPECT_TRUE(_err.starts_with("tallyctl: " + relaySocket.string() +
                               ": the daemon closed the connection; what was sent from standard input:"))
      << _err;
  EXPECT_EQ(std::count(_err.begin(), _err.end(), '\n'), 1) << _err;
  EXPECT_LT(messages().size(), kLines);
  EXPECT_GE(messages().size(), kLast);
}

}  // namespace
}  // namespace tallyd::tallyctl
