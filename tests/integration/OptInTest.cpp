// What an operator may ask for: an orderly stop, living on, retries, and looking at consent again.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <filesystem>
#include <future>
#include <set>

#include "backends/dashboard/Datagram.h"
#include "integration/TestDaemon.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;

class OptInTest : public testing::Test {
 protected:
  OptInTest() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                              {"httpsPostURL", collector->url("/events")}});
    consent(true);
  }
  ~OptInTest() override {
    if (!isReleased) release();
  }

  void consent(bool given) {
    root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", given}});
  }
  /// From now on the collector answers.
  void release() {
    isReleased = true;
    released.set_value();
  }
  std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, std::uint32_t sessionID,
                                                  const Dictionary& more = {}) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(sessionID, 5, more), std::nullopt).value,
              "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"splunk"}));
    return connection;
  }
  ServedResponse holdUntilReleased() {
    holdingBack.wait();
    return {};
  }
  /// "METHOD/STATUS" of each event, in the order of the texts.
  std::vector<std::string> methodsReceived() const {
    std::vector<std::string> methods;
    for (const auto& event : receivedEvents(*collector)) {
      methods.push_back(std::string(*event.string("_method")) + "/" + std::string(*event.string("_status")));
    }
    std::sort(methods.begin(), methods.end());  // Posts may overtake each other.
    return methods;
  }

  StorebagServer storebags;
  TestRoot root{storebags};
  std::promise<void> released;
  std::shared_future<void> holdingBack = released.get_future().share();
  bool isReleased = false;
  LoopbackServer::Handler answer;  ///< Set before the daemon starts.
  std::unique_ptr<LoopbackServer> collector = std::make_unique<LoopbackServer>(
      [this](const ReceivedRequest& request) { return answer ? answer(request) : ServedResponse(); });
};

class DrainOptionTest : public OptInTest {};

TEST_F(DrainOptionTest, EndsSessionsInOrderPostsWhatTheyHeldAndStatesTheBalance) {
  TestDaemon daemon(root, {.arguments = {"--drain", "20"}});
  auto session = startedSession(daemon, 1, {{"BatchEvent", true}});
  EXPECT_EQ(session->sendMessageSync(3, 7, Dictionary{{"a", 1}}).value, std::nullopt);
  EXPECT_EQ(collector->requests().size(), 0U);
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(methodsReceived(), (std::vector<std::string>{"0/0", "0/1", "3/7"}));
  EXPECT_EQ(daemon.process().lines().back(), "<6>Drained: accepted 3, sent 3, dropped 0, not finished 0.");
  EXPECT_EQ(daemon.process().countOnce("<7>TallydSession dealloc: 1", 1), 1U);
  EXPECT_FALSE(std::filesystem::exists(root.socket()));
}

TEST_F(DrainOptionTest, WaitsForPostsUnderWayAndAcceptsNobodyMeanwhile) {
  answer = [this](const auto&) { return holdUntilReleased(); };
  TestDaemon daemon(root, {.arguments = {"--drain", "60"}});
  auto session = startedSession(daemon, 1);
  (void)session->sendMessageSync(3, 7, Dictionary{{"a", 1}});
  daemon.process().signal(SIGTERM);
  ASSERT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 1"));
  EXPECT_THROW((void)daemon.connect(), std::exception);
  release();
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(daemon.process().lines().back(), "<6>Drained: accepted 3, sent 3, dropped 0, not finished 0.");
}

TEST_F(DrainOptionTest, EndsWhenTheTimeIsOverAndSaysWhatIsNotFinished) {
  answer = [this](const auto&) { return holdUntilReleased(); };
  TestDaemon daemon(root, {.arguments = {"--drain", "1"}});
  auto session = startedSession(daemon, 1);
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(daemon.process().lines().back(), "<4>Drained: accepted 2, sent 0, dropped 0, not finished 2.");
}

TEST_F(DrainOptionTest, WaitsForDatagramsToBeAcknowledged) {
  LoopbackDashboard dashboard;
  storebags.serve(
      "playhall",
      {{"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", dashboard.port()}, {"reliable", 50}}}},
      "max-age=600");
  TestDaemon daemon(root, {.arguments = {"--drain", "60"}});
  auto session = daemon.connect();
  session->setSessionInfoSync(sessionInfo(1), std::nullopt);
  EXPECT_EQ(session->startConfigSync().value, (std::vector<std::string>{"dashboard"}));
  daemon.process().signal(SIGTERM);
  ASSERT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 1"));
  std::set<std::uint16_t> acknowledged;
  while (acknowledged.size() < 2) {  // The start and the stop record.
    const auto datagram = dashboard.waitForDatagram();
    ASSERT_TRUE(datagram);
    dashboard.reply(*datagram);
    acknowledged.insert(datagramNumber16(*datagram, DatagramEventID));
  }
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(daemon.process().lines().back(), "<6>Drained: accepted 2, sent 2, dropped 0, not finished 0.");
}

TEST_F(DrainOptionTest, ASecondSignalEndsAtOnce) {
  answer = [this](const auto&) { return holdUntilReleased(); };
  TestDaemon daemon(root, {.arguments = {"--drain", "600"}});
  auto session = startedSession(daemon, 1);
  daemon.process().signal(SIGTERM);
  ASSERT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 1"));
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().signal, SIGTERM);
}

TEST_F(DrainOptionTest, WithoutItTheSignalEndsTheProcessAsItStands) {
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 1, {{"BatchEvent", true}});
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().signal, SIGTERM);
  EXPECT_EQ(daemon.process().count("<7>TallydSession dealloc: 1"), 0U);
  EXPECT_EQ(collector->requests().size(), 0U);
}

class ResilientOptionTest : public OptInTest {
 protected:
  /// A session of this type gets no storebag and the daemon goes on, after this line.
  void expectOnlyTheRequestFails(std::int32_t clientType, const std::string& line) {
    TestDaemon daemon(root, {.arguments = {"--resilient"}});
    auto failing = daemon.connect();
    failing->setSessionInfoSync(sessionInfo(1, clientType), std::nullopt);
    const auto started = failing->startConfigSync();
    EXPECT_EQ(started.error, std::nullopt);
    EXPECT_EQ(started.value, std::optional<std::vector<std::string>>());
    EXPECT_TRUE(daemon.process().waitForLine(line)) << daemon.process().output();
    EXPECT_EQ(failing->flushMessagesSync().error, std::nullopt);  // The connection is as it was.

    storebags.serve("vitrine", storebagWithHTTPSPost(), "max-age=600");
    auto other = daemon.connect();
    other->setSessionInfoSync(sessionInfo(2, 6), std::nullopt);
    EXPECT_EQ(other->startConfigSync().value, (std::vector<std::string>{"splunk"}));
  }
};

TEST_F(ResilientOptionTest, AClientTypeWithoutAStorebagNameCostsItsOwnRequestOnly) {
  expectOnlyTheRequestFails(3, "<2>Client type 3 has no storebag name to keep its storebag under");
}

TEST_F(ResilientOptionTest, ABagWithoutAVersionCostsItsOwnRequestOnly) {
  storebags.serveBag("playhall", Dictionary{{"release", storebagWithHTTPSPost()}}, "max-age=600");
  expectOnlyTheRequestFails(5, "<2>Storebag for client type 5 has no version");
}

TEST_F(ResilientOptionTest, ACacheControlThatEndsInMaxAgeCostsItsOwnRequestOnly) {
  storebags.serve("playhall", storebagWithHTTPSPost(), "no-cache, max-age");
  expectOnlyTheRequestFails(
      5, "<2>Cache-Control \"no-cache, max-age\" of the storebag server ends in max-age without a number");
}

class RetryOptionTest : public OptInTest {};

TEST_F(RetryOptionTest, APostThatFoundTheCollectorBusyIsPostedAgain) {
  answer = [busy = std::make_shared<std::atomic<bool>>(true)](const auto&) {
    if (busy->exchange(false)) return ServedResponse{.status = 503, .headers = {{"Retry-After", "0"}}};
    return ServedResponse();
  };
  TestDaemon daemon(root, {.arguments = {"--retry-posts", "1", "--drain", "30"}});
  auto session = startedSession(daemon, 1);
  ASSERT_TRUE(collector->waitForRequests(2)) << daemon.process().output();
  const auto posts = collector->requests();
  EXPECT_EQ(posts[0].body, posts[1].body);
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<6>Post failed, attempt 2 of 2 follows in "));
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(daemon.process().lines().back(), "<6>Drained: accepted 2, sent 2, dropped 0, not finished 0.");
}

TEST_F(RetryOptionTest, WhatStillWaitsToBeTriedAgainEndsWithTheTimeForDraining) {
  answer = [](const auto&) { return ServedResponse{.status = 503, .headers = {{"Retry-After", "60"}}}; };
  TestDaemon daemon(root, {.arguments = {"--retry-posts", "5", "--drain", "1"}});
  auto session = startedSession(daemon, 1);
  ASSERT_TRUE(daemon.process().waitForLineStartingWith("<6>Post failed, attempt 2 of 6 follows in 6"));
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(daemon.process().lines().back(), "<4>Drained: accepted 2, sent 0, dropped 0, not finished 2.");
  EXPECT_EQ(collector->requests().size(), 2U);  // Start and stop record, once each.
}

class RecheckOptionTest : public OptInTest {};

TEST_F(RecheckOptionTest, AWithdrawalStopsASessionThatRuns) {
  TestDaemon daemon(root, {.arguments = {"--recheck-consent", "--drain", "20"}});
  auto session = startedSession(daemon, 1);
  EXPECT_NE(session->sendMessageSync(3, 7, Dictionary{{"a", 1}}).value, std::nullopt);
  consent(false);
  EXPECT_EQ(session->sendMessageSync(3, 7, Dictionary{{"a", 2}}).value, std::nullopt);
  EXPECT_EQ(daemon.process().countOnce(
                "<6>Tally(HTTPSPostBackend): consent has been withdrawn, not posting 1 events", 1),
            1U);
  consent(true);
  EXPECT_EQ(session->sendMessageSync(3, 7, Dictionary{{"a", 3}}).value, std::nullopt);
  daemon.process().signal(SIGTERM);
  EXPECT_EQ(daemon.process().wait().code, 0);
  EXPECT_EQ(methodsReceived(), (std::vector<std::string>{"0/0", "3/7"}));
  EXPECT_EQ(daemon.process().lines().back(),
            "<6>Drained: accepted 5, sent 2, dropped 3 (consent-withdrawn 3), not finished 0.");
}

TEST_F(RecheckOptionTest, WithoutItARunningSessionKeepsWhatItRead) {
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 1);
  consent(false);
  EXPECT_NE(session->sendMessageSync(3, 7, Dictionary{{"a", 1}}).value, std::nullopt);
  EXPECT_TRUE(collector->waitForRequests(2));
}

class OptInArgumentsTest : public testing::Test {
 protected:
  static WatchedProcess run(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), TestDaemon::program());
    return WatchedProcess({.arguments = std::move(arguments)});
  }
};

TEST_F(OptInArgumentsTest, RefusesWhatIsOutOfRange) {
  for (const auto& arguments : std::vector<std::vector<std::string>>{{"--drain", "0"},
                                                                     {"--drain", "-1"},
                                                                     {"--drain", "601"},
                                                                     {"--drain", "soon"},
                                                                     {"--drain"},
                                                                     {"--retry-posts", "-1"},
                                                                     {"--retry-posts", "11"},
                                                                     {"--retry-posts", "often"},
                                                                     {"--resilient=perhaps"},
                                                                     {"--recheck-consent=perhaps"}}) {
    auto process = run(arguments);
    EXPECT_EQ(process.wait().code, 2) << arguments[0];
    EXPECT_NE(process.output().find(arguments[0].substr(0, arguments[0].find('='))), std::string::npos)
        << process.output();
  }
}

TEST_F(OptInArgumentsTest, TheHelpNamesThem) {
  auto process = run({"--help"});
  EXPECT_EQ(process.wait().code, 0);
  for (const char* option : {"--drain SECONDS", "--resilient", "--retry-posts N", "--recheck-consent"}) {
    EXPECT_NE(process.output().find(option), std::string::npos) << process.output();
  }
}

}  // namespace
}  // namespace tallyd::test
