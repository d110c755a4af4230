// Connections come and go.

#include "daemon/TallydAgent.h"

#include "AgentFixture.h"
#include "framework/ClientSessionInterface.h"
#include "unit/session/PostedEvents.h"

namespace tallyd {
namespace {

class TallydAgentTest : public AgentFixture {
 protected:
  /// How the last session that was made shows in the log.
  std::string sessionNamedIn(const fakes::FakeLog::Line& line) {
    const auto start = line.text.find("<TallydSession: 0x");
    const auto end = line.text.find('>', start);
    EXPECT_NE(end, std::string::npos) << line;
    return end == std::string::npos ? "" : line.text.substr(start, end - start + 1);
  }
};

TEST_F(TallydAgentTest, TheFirstConnectionIsAcceptedWithBothCountsZero) {
  const auto connection = std::make_shared<fakes::FakeServiceConnection>("client 4711 of user 501");
  EXPECT_TRUE(agent.shouldAcceptNewConnection(connection));
  const Lines lines = fake.log.lines();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[0], debug("Accepting new XPC connection client 4711 of user 501, 0(0) connections."));
  EXPECT_EQ(lines[1], debug("TallydSession initWithSessionDelegate:" + agent.description()));
  EXPECT_EQ(lines[2], debug("Initialized session with UUID AAAAAAAAQACAAAAAAAAAAQ=="));
}

TEST_F(TallydAgentTest, TheConnectionExportsTheClientInterfaceAndRuns) {
  const Connection connection = connect();
  EXPECT_EQ(connection->exportedInterface(), &clientSessionInterface());
  EXPECT_TRUE(connection->resumed());
  const auto call = connection->call("FetchDisplayURL");
  ASSERT_EQ(call->replies.size(), 1U);
  EXPECT_EQ(call->replies[0], std::vector<Value>{"URL not available"});
}

TEST_F(TallydAgentTest, AcceptanceCountsTheSessionsBeforeTheNewOne) {
  const Connection first = connect();
  const Connection second = connect();
  const Connection third = connect();
  const Lines lines = fake.log.lines();
  for (std::size_t i = 0; i < 3; ++i) {
    EXPECT_EQ(lines[3 * i], debug("Accepting new XPC connection client 1 of user 0, " + std::to_string(i) +
                                  "(0) connections."));
  }
  second->invalidate();
  EXPECT_EQ(counts(), "2(0)");
}

TEST_F(TallydAgentTest, AConnectionForWhichThereIsNoMemoryIsRefusedAndForgotten) {
  const auto ledger = std::make_shared<Ledger>();
  TallydAgent booking(platform, ledger);
  auto connection = std::make_shared<fakes::FakeServiceConnection>();
  connection->hasNoMemory = true;
  EXPECT_FALSE(booking.shouldAcceptNewConnection(connection));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Critical, "No memory for a new connection"));
  EXPECT_EQ(ledger->snapshot().dictionary("connections")->integer("open"), 0);
  connection.reset();
  EXPECT_TRUE(ledger->isSettled());
  fake.log.clear();
  EXPECT_TRUE(booking.shouldAcceptNewConnection(std::make_shared<fakes::FakeServiceConnection>()));
  EXPECT_EQ(fake.log.lines().at(0),
            debug("Accepting new XPC connection client 1 of user 0, 0(0) connections."));
}

TEST_F(TallydAgentTest, EachConnectionHasASessionOfItsOwn) {
  const Connection first = connect();
  const Connection second = connect();
  configure(first, 1, 5);
  configure(second, 2, 5);
  fake.log.clear();
  first->call("FetchDisplayURL");
  second->call("FetchDisplayURL");
  EXPECT_EQ(fake.log.lines(), (Lines{debug("Fetching display URL for session 1"),
                                     debug("Fetching display URL for session 2")}));
}

TEST_F(TallydAgentTest, AnInterruptionIsLoggedAndLeavesTheSessionInPlace) {
  const Connection connection = connect();
  configure(connection, 9, 5, some(userInfo("phone", "calls")));
  fake.log.clear();
  connection->interrupt();
  const Lines lines = fake.log.lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0], debug("XPC connection to " + sessionNamedIn(lines[0]) + " was interrupted"));
  EXPECT_EQ(counts(), "1(1)");
  EXPECT_EQ(connection->call("FlushMessages")->replies.size(), 1U);
}

TEST_F(TallydAgentTest, AnInterruptionAndTheInvalidationBehindItLogBothLinesAndRemoveTheSessionOnce) {
  const Connection other = connect();
  const Connection connection = connect();
  configure(connection, 9, 5);
  fake.log.clear();
  connection->interrupt();
  connection->invalidate();
  const Lines lines = fake.log.lines();
  ASSERT_EQ(lines.size(), 4U);
  const std::string session = sessionNamedIn(lines[0]);
  EXPECT_EQ(lines,
            (Lines{debug("XPC connection to " + session + " was interrupted"),
                   debug("XPC connection to " + session + " was invalidated"),
                   debug("TallydSession dealloc: 9"), debug("No backends available to send message")}));
  EXPECT_EQ(counts(), "1(0)");
}

TEST_F(TallydAgentTest, InvalidationEndsTheSessionAfterItsLine) {
  const Connection connection = connect();
  fake.log.clear();
  connection->invalidate();
  const Lines lines = fake.log.lines();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_TRUE(lines[0].text.ends_with(" was invalidated"));
  EXPECT_EQ(lines[1], debug("TallydSession dealloc: 0"));
}

TEST_F(TallydAgentTest, ASessionWithoutUserInfoIsInNoGroup) {
  const Connection connection = connect();
  configure(connection, 9, 5);
  EXPECT_EQ(counts(), "1(0)");
  connection->invalidate();
  EXPECT_EQ(counts(), "0(0)");
}

TEST_F(TallydAgentTest, GroupsStayWhenTheirLastSessionHasGone) {
  const Connection first = connect();
  const Connection second = connect();
  configure(first, 1, 5, some(userInfo("phone", "calls")));
  configure(second, 2, 5, some(userInfo("PHONE", "Calls")));
  EXPECT_EQ(counts(), "2(1)");
  first->invalidate();
  EXPECT_EQ(counts(), "1(1)");
  second->invalidate();
  EXPECT_EQ(counts(), "0(1)");

  const Connection third = connect();
  configure(third, 3, 5, some(userInfo("tablet", "calls")));
  EXPECT_EQ(counts(), "1(2)");
  third->invalidate();
  EXPECT_EQ(counts(), "0(2)");
}

TEST_F(TallydAgentTest, TheInvalidationOfASessionWithoutUserInfoLeavesTheNamelessGroupAlone) {
  const Connection nameless = connect();
  configure(nameless, 1, 5, some(Dictionary()));
  const Connection silent = connect();
  configure(silent, 2, 5);
  EXPECT_EQ(counts(), "2(1)");
  silent->invalidate();
  EXPECT_EQ(counts(), "1(1)");
  nameless->invalidate();
  EXPECT_EQ(counts(), "0(1)");
}

TEST_F(TallydAgentTest, ASessionsLifeFromStorebagToStopRecord) {
  const Connection connection = connect();
  configure(connection, 9, 5, some(userInfo("phone", "calls")));
  platform::Array states;
  states.append(platform::Array({"splunk"}));
  EXPECT_EQ(connection->call("StartConfig")->replies.at(0), std::vector<Value>{states});
  EXPECT_EQ(fake.http.synchronousRequests().size(), 1U);
  connection->call("SendMessageWithCategory", {3, 4, some({{"a", 1}})});
  connection->invalidate();

  const auto posts = fake.http.posts();
  ASSERT_EQ(posts.size(), 3U);
  const std::pair<const char*, const char*> records[] = {{"0", "0"}, {"3", "4"}, {"0", "1"}};
  for (std::size_t i = 0; i < 3; ++i) {
    EXPECT_EQ(posts[i].url, "https://post.test/in");
    const auto events = postedEvents(posts[i]);
    ASSERT_EQ(events.size(), 1U);
    EXPECT_EQ(events[0].string("_method"), records[i].first);
    EXPECT_EQ(events[0].string("_status"), records[i].second);
    EXPECT_EQ(events[0].string("_eventNumber"), std::to_string(i + 1));
  }
  EXPECT_EQ(postedEvents(posts[2]).at(0).string("StorebagVersion"), "bag 17");
}

TEST_F(TallydAgentTest, SessionsOfOneClientTypeShareTheCachedStorebag) {
  for (std::int64_t sessionID = 1; sessionID <= 3; ++sessionID) {
    const Connection connection = connect();
    configure(connection, sessionID, 5);
    connection->call("StartConfig");
    connection->invalidate();
  }
  EXPECT_EQ(fake.http.synchronousRequests().size(), 1U);
  EXPECT_TRUE(
      fake.log.has(platform::LogLevel::Debug, "Retrieving storebag for session 2 with client type 5"));
  EXPECT_EQ(fake.log.count(platform::LogLevel::Debug, "Cached storebag found for client type 5"), 2U);
}

TEST_F(TallydAgentTest, AFailedFetchIsTriedAgainOnlyAfterTheWait) {
  fake.http.answer = [](const platform::HTTPRequest&) {
    return fakes::FakeHTTPClient::failure("no network");
  };
  const Connection connection = connect();
  configure(connection, 9, 5);
  EXPECT_EQ(connection->call("StartConfig")->replies.at(0), std::vector<Value>{none()});
  fake.http.answer = StorebagServer();
  EXPECT_EQ(connection->call("StartConfig")->replies.at(0), std::vector<Value>{none()});
  fake.clock.advance(std::chrono::seconds(900));
  EXPECT_NE(connection->call("StartConfig")->replies.at(0), std::vector<Value>{none()});
  EXPECT_EQ(fake.http.synchronousRequests().size(), 2U);
}

TEST_F(TallydAgentTest, AOneShotMessageMayBeTheOnlyCallOnAConnection) {
  const Connection connection = connect();
  const auto call =
      connection->call("SendMessageWithSessionInfo",
                       {some(sessionInfo(9, 5)), some(userInfo("phone", "calls")), 3, 4, some({{"a", 1}})});
  EXPECT_EQ(call->replies.at(0), std::vector<Value>{"finished"});
  ASSERT_EQ(fake.http.posts().size(), 1U);
  EXPECT_EQ(postedEvents(fake.http.posts()[0]).at(0).string("_sessionID"), "9");
}

}  // namespace
}  // namespace tallyd
