// The real daemon is killed and comes back: a client's session goes on by itself.

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <algorithm>
#include <condition_variable>
#include <csignal>
#include <mutex>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;

class ClientReconnectTest : public testing::Test {
 protected:
  ClientReconnectTest() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                              {"httpsPostURL", collector.url("/events")}});
    daemon = std::make_unique<TestDaemon>(root);
  }
  [[nodiscard]] TallyConnectionOptions options() const {
    return {.socketPath = root.socket(),
            .timeout = WatchedProcess::kPatience,
            .firstPause = std::chrono::milliseconds(10),
            .maximumPause = std::chrono::milliseconds(100)};
  }
  void kill() {
    daemon->process().signal(SIGKILL);
    daemon->process().wait();
  }
  std::size_t eventsWith(const std::string& key) const {
    std::size_t count = 0;
    for (const Dictionary& event : receivedEvents(collector)) count += event.contains(key) ? 1 : 0;
    return count;
  }

  StorebagServer storebags;
  LoopbackServer collector;
  TestRoot root{storebags};
  std::unique_ptr<TestDaemon> daemon;
};

TEST_F(ClientReconnectTest, TheSessionIsConfiguredAndStartedAgainBeforeWhatWaited) {
  TallyConnection connection(options());
  std::mutex mutex;
  std::condition_variable changed;
  bool interrupted = false;
  connection.setInterruptionHandler([&] {
    const std::lock_guard lock(mutex);
    interrupted = true;
    changed.notify_all();
  });
  EXPECT_EQ(connection.setSessionInfoSync(sessionInfo(77), std::nullopt).value, "received");
  EXPECT_TRUE(connection.startConfigSync().value);
  ASSERT_FALSE(connection.sendMessageSync(3, 0, Dictionary{{"before", 1}}).error);
  ASSERT_TRUE(collector.waitForRequests(2));
  kill();
  {
    std::unique_lock lock(mutex);
    ASSERT_TRUE(changed.wait_for(lock, WatchedProcess::kPatience, [&] { return interrupted; }));
  }
  EXPECT_TRUE(connection.sendMessage(3, 0, Dictionary{{"meanwhile", 1}}, [](const auto& reply) {
    EXPECT_FALSE(reply.error) << reply.error.value_or("");
  }));
  daemon = std::make_unique<TestDaemon>(root);
  EXPECT_FALSE(connection.sendMessageSync(3, 0, Dictionary{{"after", 1}}).error);
  ASSERT_TRUE(collector.waitForRequests(5));  // Twice a start record; three messages.
  EXPECT_EQ(eventsWith("before"), 1U);
  EXPECT_EQ(eventsWith("meanwhile"), 1U);
  EXPECT_EQ(eventsWith("after"), 1U);

  const auto lines = daemon->process().lines();
  const auto place = [&lines](const std::string& start) {
    return std::find_if(lines.begin(), lines.end(),
                        [&](const auto& line) { return line.starts_with(start); });
  };
  EXPECT_LT(place("<7>Configuring session 77"), place("<7>Starting configuration for session 77"));
  EXPECT_LT(place("<7>Starting configuration for session 77"), place("<7>Sending message for session 77"));
  EXPECT_NE(place("<7>Sending message for session 77"), lines.end());
}

TEST_F(ClientReconnectTest, ADaemonThatIsStoppedHoldsNobody) {
  TallyConnection connection(options());
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "URL not available");
  daemon->process().signal(SIGSTOP);
  int status = 0;
  ASSERT_EQ(::waitpid(daemon->process().pid(), &status, WUNTRACED), daemon->process().pid());
  ASSERT_TRUE(WIFSTOPPED(status));
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(connection.fetchDisplayURLSync(std::chrono::milliseconds(100)).kind, TallyError::TimedOut);
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(3));
  daemon->process().signal(SIGCONT);
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "URL not available");
}

}  // namespace
}  // namespace tallyd::test
