#include <fmt/format.h>

#include "CuttableRelay.h"
#include "ToolTest.h"
#include "platform/JSON.h"

namespace tallyd::tallyctl {
namespace {

using std::chrono::milliseconds;

class WatchCommandTest : public ToolTest {
 protected:
  WatchCommandTest() {
    _whileWaiting = [this](SteadyTime) { writeCounters(kStatAfter, kDiskstatsAfter, kNetDevAfter); };
  }

  /// The payload of each sample that arrived.
  [[nodiscard]] std::vector<Dictionary> samples() const {
    std::vector<Dictionary> samples;
    for (const auto& call : _daemon.callsOf(Method::SendMessageWithCategory)) {
      samples.push_back(*(*call.arguments[2].array())[0].dictionary());
    }
    return samples;
  }
};

TEST_F(WatchCommandTest, ReportsQualitySamplesUntilStopped) {
  _waits = 2;
  EXPECT_EQ(run({"watch", "--session-id", "7"}), kSucceeded);
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[0],
            Value(Array{Dictionary{{"SessionID", 7}, {"ClientType", 5}}}));
  EXPECT_EQ(messages(), (std::vector<Value>{message(1, 0), message(1, 0)}));
  ASSERT_EQ(samples().size(), 2U);
  EXPECT_EQ(samples()[0].integer("number"), 1);
  EXPECT_EQ(samples()[0].real("interval_seconds"), 1.0);
  EXPECT_EQ(samples()[0].real("cpu_user"), 0.25);
  EXPECT_EQ(samples()[0].real("network_rx_bytes_per_second"), 1200.0);
  EXPECT_EQ(samples()[1].integer("number"), 2);
  EXPECT_EQ(samples()[1].real("network_rx_bytes_per_second"), 0.0);
  EXPECT_EQ(_daemon.calls().back().method, Method::FlushMessages);
}

TEST_F(WatchCommandTest, PrintsEachSampleOnALineAndTotals) {
  EXPECT_EQ(run({"watch", "--session-id", "7"}), kSucceeded);
  EXPECT_EQ(_out, "session 7, states: https_post, dashboard\nsent 0 samples, 0 failed\n");
  _waits = 1;
  EXPECT_EQ(run({"watch", "--session-id", "7"}), kSucceeded);
  EXPECT_NE(_out.find("\n#1 cpu user 25.0% "), std::string::npos) << _out;
  EXPECT_TRUE(_out.ends_with("\nsent 1 samples, 0 failed\n")) << _out;
  EXPECT_EQ(std::count(_out.begin(), _out.end(), '\n'), 3);
}

TEST_F(WatchCommandTest, PrintsWhatItSentAsJSON) {
  _waits = 2;
  EXPECT_EQ(run({"watch", "--json", "--session-id", "7"}), kSucceeded);
  ASSERT_EQ(samples().size(), 2U);
  EXPECT_EQ(_out,
            *platform::jsonFromValue(samples()[0]) + "\n" + *platform::jsonFromValue(samples()[1]) + "\n");
  EXPECT_EQ(_err, "session 7, states: https_post, dashboard\nsent 2 samples, 0 failed\n");
}

TEST_F(WatchCommandTest, EndsItsJSONWithWhatFailed) {
  _waits = 1;
  _daemon.script.rejects = [](auto) { return true; };
  EXPECT_EQ(run({"--json", "watch"}), kFailed);
  ASSERT_EQ(objects().size(), 2U);
  EXPECT_EQ(objects()[0].integer("number"), 1);
  EXPECT_EQ(objects()[1], (Dictionary{{"ok", false}, {"error", "sent 0 samples, 1 failed"}}));
}

TEST_F(WatchCommandTest, EndsInOrderAndQuietlyWhenNobodyReadsAnyMore) {
  _waits = 1'000'000;
  FailingOutput output(2, EPIPE);
  std::ostream out(&output);
  EXPECT_EQ(runInto(out, {"watch", "--session-id", "7"}), kClosedPipe);
  EXPECT_EQ(_err, "");
  EXPECT_EQ(std::count(output.taken().begin(), output.taken().end(), '\n'), 2);
  EXPECT_EQ(samples().size(), 2U);
  EXPECT_EQ(_daemon.calls().back().method, Method::FlushMessages);
}

TEST_F(WatchCommandTest, EndsAndSaysSoWhenItsOutputIsFull) {
  _waits = 1'000'000;
  FailingOutput output(1, ENOSPC);
  std::ostream out(&output);
  EXPECT_EQ(runInto(out, {"watch"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard output: No space left on device\n");
}

TEST_F(WatchCommandTest, EndsAfterTheAskedNumberOfSamples) {
  _waits = 100;
  EXPECT_EQ(run({"watch", "--count", "3"}), kSucceeded);
  EXPECT_EQ(samples().size(), 3U);
}

TEST_F(WatchCommandTest, KeepsToTheGridOfItsInterval) {
  _waits = 3;
  std::vector<SteadyTime> times;
  _whileWaiting = [&times](SteadyTime time) { times.push_back(time); };
  EXPECT_EQ(run({"watch", "--interval", "2.5"}), kSucceeded);
  ASSERT_EQ(times.size(), 3U);
  EXPECT_EQ(times[1] - times[0], milliseconds(2500));
  EXPECT_EQ(times[2] - times[1], milliseconds(2500));
  EXPECT_EQ(samples()[0].real("interval_seconds"), 2.5);
}

TEST_F(WatchCommandTest, FailsWhenASampleIsRejected) {
  _waits = 1;
  _daemon.script.rejects = [](auto) { return true; };
  EXPECT_EQ(run({"watch"}), kFailed);
  EXPECT_TRUE(_err.starts_with("tallyctl: sample 1: ")) << _err;
  EXPECT_TRUE(_out.ends_with("sent 0 samples, 1 failed\n")) << _out;
}

TEST_F(WatchCommandTest, NamesTheFileThatItCannotRead) {
  _waits = 1;
  _whileWaiting = [this](SteadyTime) { std::filesystem::remove(_proc / "diskstats"); };
  EXPECT_EQ(run({"watch"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: " + (_proc / "diskstats").string() + ": No such file or directory\n");
}

TEST_F(WatchCommandTest, NamesTheFileThatItCannotUnderstand) {
  writeFile(_proc / "stat", "something else\n");
  EXPECT_EQ(run({"watch"}), kFailed);
  EXPECT_EQ(_err, "tallyctl: " + (_proc / "stat").string() + ": not of the form that is known\n");
}

TEST_F(WatchCommandTest, EndsWhenTheDaemonIsGone) {
  const auto relaySocket = _folder.path() / "relay";
  CuttableRelay relay(relaySocket, std::exchange(_socket, relaySocket));
  _daemon.script.sendResult = [&relay, isFirst = true](auto) mutable {
    // Later samples may still be on their way when the relay is gone.
    if (std::exchange(isFirst, false)) relay.cut();
    return std::nullopt;
  };
  _waits = 1'000'000;
  EXPECT_EQ(run({"watch"}), kFailed);
  EXPECT_NE(_err.find(relaySocket.string() + ": the daemon closed the connection\n"), std::string::npos)
      << _err;
}

}  // namespace
}  // namespace tallyd::tallyctl
