#include "daemon/Drain.h"

#include "AgentFixture.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd {
namespace {

using namespace std::chrono_literals;

class DrainTest : public testing::Test {
 protected:
  void start(std::chrono::milliseconds time) {
    drain.start(time, [this](Drain::End end) { ends.push_back(end); });
  }

  fakes::FakeQueues queues;
  Ledger ledger;
  Drain drain{queues, ledger};
  std::vector<Drain::End> ends;
};

TEST_F(DrainTest, IsDoneAtOnceWhenNothingIsUnderWay) {
  start(5s);
  queues.advance(0ms);
  EXPECT_EQ(ends, std::vector{Drain::End::Settled});
  EXPECT_EQ(queues.armedTimers(), 0U);
}

TEST_F(DrainTest, WaitsForSessionsAndForWhatTheyLeaveBehind) {
  auto book = ledger.openBook();
  auto account = book->openAccount("splunk", "https-post");
  account->start(3);
  start(5s);
  queues.advance(1s);
  EXPECT_TRUE(ends.empty());
  book.reset();
  queues.advance(1s);
  EXPECT_TRUE(ends.empty());  // The posts outlive their session.
  account->finish(3);
  account.reset();
  queues.advance(Drain::kLookPeriod);
  EXPECT_EQ(ends, std::vector{Drain::End::Settled});
}

TEST_F(DrainTest, EndsWhenItsTimeIsOver) {
  const auto book = ledger.openBook();
  start(5s);
  queues.advance(5s - 1ms);
  EXPECT_TRUE(ends.empty());
  queues.advance(1ms);
  EXPECT_EQ(ends, std::vector{Drain::End::TimeOver});
  queues.advance(1min);
  EXPECT_EQ(ends.size(), 1U);
  EXPECT_EQ(queues.armedTimers(), 0U);
}

TEST(DrainLifeTest, SaysNothingAfterItsEnd) {
  fakes::FakeQueues queues;
  Ledger ledger;
  int ends = 0;
  {
    Drain drain(queues, ledger);
    drain.start(5s, [&ends](Drain::End) { ++ends; });
  }
  queues.advance(1min);
  EXPECT_EQ(ends, 0);
  EXPECT_EQ(queues.armedTimers(), 0U);
}

TEST(BalanceLineTest, AddsTheBackendsUpAndNamesEachReason) {
  SessionCounts totals;
  totals.messages.accepted = 99;
  AccountCounts& posts = totals.backends[{"splunk", "https-post"}];
  posts.accepted = 10;
  posts.sent = 6;
  posts.held = 1;
  posts.inFlight = 1;
  posts.droppedFor(DropReason::PostFailed) = 2;
  AccountCounts& datagrams = totals.backends[{"dashboard", "dashboard"}];
  datagrams.accepted = 4;
  datagrams.sent = 3;
  datagrams.droppedFor(DropReason::CleanUp) = 1;
  EXPECT_EQ(balanceLine(totals),
            "Drained: accepted 14, sent 9, dropped 3 (post-failed 2, clean-up 1), not finished 2.");
  EXPECT_EQ(unfinishedOf(totals), 2U);
}

TEST(BalanceLineTest, LeavesTheReasonsOutWhenNothingWasDropped) {
  EXPECT_EQ(balanceLine({}), "Drained: accepted 0, sent 0, dropped 0, not finished 0.");
}

class AgentDrainTest : public AgentFixture {
 protected:
  struct Outcome {
    std::optional<Drain::End> end;
    std::string balance;
  };
  /// A session with a dashboard from which nothing is heard; what a drain of this time comes to.
  Outcome drained(std::chrono::seconds time) {
    const test::LoopbackDashboard dashboard;
    const Dictionary entry{{"ip", "127.0.0.1"}, {"port", dashboard.port()}, {"reliable", 8000}};
    const std::string body = fakes::StorebagSigner::server().envelope(
        Dictionary{{"version", "1"}, {"release", Dictionary{{"dashboard", entry}}}});
    fake.http.answer = [&body](const auto&) { return fakes::FakeHTTPClient::ok(body); };
    const auto ledger = std::make_shared<Ledger>();
    TallydAgent draining(platform, ledger);
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    draining.shouldAcceptNewConnection(connection);
    configure(connection, 1, 5);
    connection->call("StartConfig");
    draining.endSessions();
    Outcome outcome;
    Drain drain(fake.queues, *ledger);
    drain.start(time, [&outcome](Drain::End how) { outcome.end = how; });
    fake.queues.advance(time);
    outcome.balance = balanceLine(ledger->totals());
    fake.queues.advance(20s);  // The daemon would have ended; here what waits is to go.
    return outcome;
  }
};

TEST_F(AgentDrainTest, EndsEverySessionAsIfItsClientHadLeft) {
  std::vector<Connection> connections;
  for (std::int64_t session = 1; session <= 3; ++session) {
    connections.push_back(connect());
    configure(connections.back(), session, 5, some(userInfo("phone", "calls")));
    connections.back()->call("StartConfig");
  }
  connections[2]->invalidate();
  const std::size_t posted = fake.http.posts().size();
  fake.log.clear();
  agent.endSessions();
  EXPECT_EQ(connections[0]->finished, 1);
  EXPECT_EQ(connections[1]->finished, 1);
  EXPECT_EQ(connections[2]->finished, 0);
  EXPECT_EQ(fake.http.posts().size(), posted + 2);  // Two stop records.
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Debug, "TallydSession dealloc: 1"));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Debug, "TallydSession dealloc: 2"));
  agent.endSessions();
  EXPECT_EQ(connections[0]->finished, 1);
}

TEST_F(AgentDrainTest, ALedgerIsSettledOnceTheSessionsHaveEndedAndTheirPostsAreDone) {
  const auto ledger = std::make_shared<Ledger>();
  TallydAgent drained(platform, ledger);
  EXPECT_TRUE(ledger->isSettled());
  auto connection = std::make_shared<fakes::FakeServiceConnection>();
  drained.shouldAcceptNewConnection(connection);
  EXPECT_FALSE(ledger->isSettled());
  configure(connection, 1, 5, some(userInfo("phone", "calls")));
  connection->call("StartConfig");
  drained.endSessions();
  EXPECT_FALSE(ledger->isSettled());  // Start and stop record are under way.
  fake.queues.run();
  EXPECT_TRUE(ledger->isSettled());
  EXPECT_EQ(balanceLine(ledger->totals()), "Drained: accepted 2, sent 2, dropped 0, not finished 0.");
}

TEST_F(AgentDrainTest, DatagramsThatNobodyAcknowledgesAreGivenUpWithinEighteenSeconds) {
  const Outcome enough = drained(18s);
  EXPECT_EQ(enough.end, Drain::End::Settled);
  EXPECT_EQ(enough.balance, "Drained: accepted 2, sent 0, dropped 2 (clean-up 2), not finished 0.");
  const Outcome tooLittle = drained(17s);
  EXPECT_EQ(tooLittle.end, Drain::End::TimeOver);
  EXPECT_EQ(tooLittle.balance, "Drained: accepted 2, sent 0, dropped 0, not finished 2.");
}

class AgentOptionsTest : public AgentFixture {};

TEST_F(AgentOptionsTest, AClientTypeWithoutStorebagFailsItsRequestWhenTheDaemonIsToGoOn) {
  TallydAgent resilient(platform, std::make_shared<Ledger>(),
                        {.fatalFailures = platform::FatalFailures::FailRequest});
  auto connection = std::make_shared<fakes::FakeServiceConnection>();
  resilient.shouldAcceptNewConnection(connection);
  const auto start = connection->call("StartConfig");
  ASSERT_EQ(start->replies.size(), 1U);
  EXPECT_EQ(start->replies[0], std::vector<Value>{none()});
  const auto oneShot =
      connection->call("SendMessageWithSessionInfo", {some(sessionInfo(9, 3)), none(), 1, 2, none()});
  ASSERT_EQ(oneShot->replies.size(), 1U);
  EXPECT_EQ(oneShot->replies[0], std::vector<Value>{Value("storebag not available")});
  EXPECT_EQ(fake.log.count(platform::LogLevel::Critical,
                           "Client type 3 has no storebag name to keep its storebag under"),
            1U);
  configure(connection, 1, 5, some(userInfo("phone", "calls")));
  EXPECT_NE(connection->call("StartConfig")->replies[0], std::vector<Value>{none()});
}

TEST_F(AgentOptionsTest, BackendsReadConsentAgainWhenAskedTo) {
  for (const auto checks : {ConsentChecks::AtStart, ConsentChecks::BeforeEachPost}) {
    fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", true);
    TallydAgent asking(platform, std::make_shared<Ledger>(), {.consentChecks = checks});
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    asking.shouldAcceptNewConnection(connection);
    configure(connection, 1, 5, some(userInfo("phone", "calls")));
    connection->call("StartConfig");
    fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", false);
    const std::size_t before = fake.http.posts().size();
    connection->call("SendMessageWithCategory", {3, 0, some(Dictionary{{"a", 1}})});
    EXPECT_EQ(fake.http.posts().size() - before, checks == ConsentChecks::AtStart ? 1U : 0U);
    connection->invalidate();
  }
}

}  // namespace
}  // namespace tallyd
