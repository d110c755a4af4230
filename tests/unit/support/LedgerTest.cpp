#include "support/Ledger.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;

/// The row of a backend in "ended", "total" or a session.
Dictionary rowOf(const Dictionary& sums, std::string_view backend) {
  for (const auto& row : *sums.array("backends")) {
    if (row.dictionary()->string("name") == backend) return *row.dictionary();
  }
  return {};
}

std::int64_t number(const Dictionary& row, std::string_view key) { return row.integer(key).value_or(-1); }

TEST(LedgerTest, BeginsEmpty) {
  const Dictionary stats = Ledger().snapshot();
  EXPECT_EQ(*stats.dictionary("connections"), (Dictionary{{"accepted", 0}, {"open", 0}}));
  EXPECT_TRUE(stats.array("sessions")->empty());
  EXPECT_EQ(number(stats, "sessionsNotShown"), 0);
  EXPECT_EQ(number(*stats.dictionary("ended"), "sessions"), 0);
  EXPECT_TRUE(stats.dictionary("total")->array("backends")->empty());
}

TEST(LedgerTest, CountsConnections) {
  Ledger ledger;
  ledger.connectionAccepted();
  ledger.connectionAccepted();
  ledger.connectionEnded();
  EXPECT_EQ(*ledger.snapshot().dictionary("connections"), (Dictionary{{"accepted", 2}, {"open", 1}}));
}

TEST(LedgerTest, ShowsASessionWithItsBackends) {
  Ledger ledger;
  const auto book = ledger.openBook();
  book->describe(4'000'000'000U, 7, "demo");
  const auto account = book->openAccount("splunk", "https-post");
  book->messages().send();
  account->hold(2);
  const Dictionary stats = ledger.snapshot();
  ASSERT_EQ(stats.array("sessions")->size(), 1U);
  const Dictionary& session = *(*stats.array("sessions"))[0].dictionary();
  EXPECT_EQ(number(session, "session"), 1);
  EXPECT_EQ(number(session, "sessionID"), 4'000'000'000);
  EXPECT_EQ(number(session, "clientType"), 7);
  EXPECT_EQ(session.string("clientName"), "demo");
  EXPECT_EQ(number(*session.dictionary("messages"), "sent"), 1);
  EXPECT_EQ(rowOf(session, "splunk").string("kind"), "https-post");
  EXPECT_EQ(number(rowOf(session, "splunk"), "held"), 2);
  EXPECT_EQ(number(rowOf(*stats.dictionary("total"), "splunk"), "held"), 2);
}

TEST(LedgerTest, StampsAnAccountWithWhoTheSessionWasThen) {
  Ledger ledger;
  const auto book = ledger.openBook();
  book->describe(5, 6, "first");
  const auto account = book->openAccount("dashboard", "dashboard");
  book->describe(5, 6, "second");
  EXPECT_EQ(account->owner().clientName, "first");
  EXPECT_EQ(account->owner().session, 1U);
  EXPECT_EQ(account->owner().backend, "dashboard");
}

TEST(LedgerTest, MovesAnEndedSessionToTheSumOfThoseThatEnded) {
  Ledger ledger;
  auto book = ledger.openBook();
  auto account = book->openAccount("splunk", "https-post");
  account->send(3);
  account = nullptr;
  book->messages().send(3);
  book = nullptr;
  const Dictionary stats = ledger.snapshot();
  EXPECT_TRUE(stats.array("sessions")->empty());
  const Dictionary& ended = *stats.dictionary("ended");
  EXPECT_EQ(number(ended, "sessions"), 1);
  EXPECT_EQ(number(*ended.dictionary("messages"), "accepted"), 3);
  EXPECT_EQ(number(rowOf(ended, "splunk"), "sent"), 3);
  EXPECT_EQ(number(rowOf(*stats.dictionary("total"), "splunk"), "sent"), 3);
}

TEST(LedgerTest, KeepsWhatIsUnderWayAfterTheSession) {
  Ledger ledger;
  auto book = ledger.openBook();
  const auto account = book->openAccount("splunk", "https-post");
  account->start(2);
  book = nullptr;
  EXPECT_EQ(number(rowOf(*ledger.snapshot().dictionary("ended"), "splunk"), "inFlight"), 2);
  account->finish();
  account->drop(DropReason::PostFailed);
  const Dictionary row = rowOf(*ledger.snapshot().dictionary("ended"), "splunk");
  EXPECT_EQ(number(row, "inFlight"), 0);
  EXPECT_EQ(number(row, "sent"), 1);
  EXPECT_EQ(*row.dictionary("dropped"), (Dictionary{{"post-failed", 1}}));
}

TEST(LedgerTest, AddsUpTheBackendsThatAStartReplaced) {
  Ledger ledger;
  const auto book = ledger.openBook();
  for (int i = 0; i < 1'000; ++i) book->openAccount("splunk", "https-post")->send();
  const auto present = book->openAccount("splunk", "https-post");
  present->hold();
  const SessionCounts counts = book->counts();
  ASSERT_EQ(counts.backends.size(), 1U);
  EXPECT_EQ(counts.backends.begin()->second.sent, 1'000U);
  EXPECT_EQ(counts.backends.begin()->second.held, 1U);
}

TEST(LedgerTest, KeepsBackendsOfOneNameAndTwoKindsApart) {
  Ledger ledger;
  const auto book = ledger.openBook();
  const auto one = book->openAccount("out", "dashboard");
  const auto other = book->openAccount("out", "upload");
  one->send();
  other->send(2);
  EXPECT_EQ(book->counts().backends.size(), 2U);
}

TEST(LedgerTest, LosesNothingOverManySessions) {
  Ledger ledger;
  std::vector<std::shared_ptr<Account>> late;
  constexpr int kSessions = 500;
  for (int i = 0; i < kSessions; ++i) {
    const auto book = ledger.openBook();
    const auto account = book->openAccount("splunk", "https-post");
    account->start();
    if (i % 10 == 0) {
      late.push_back(account);
    } else {
      account->finish();
    }
  }
  Dictionary row = rowOf(*ledger.snapshot().dictionary("total"), "splunk");
  EXPECT_EQ(number(row, "accepted"), kSessions);
  EXPECT_EQ(number(row, "inFlight"), 50);
  for (const auto& account : late) account->finish();
  late.clear();
  const Dictionary ended = *ledger.snapshot().dictionary("ended");
  EXPECT_EQ(number(ended, "sessions"), kSessions);
  EXPECT_EQ(number(rowOf(ended, "splunk"), "sent"), kSessions);
}

TEST(LedgerTest, ShowsABoundedNumberOfSessionsAndTheTotalOfAll) {
  Ledger ledger;
  std::vector<std::shared_ptr<SessionBook>> books;
  for (std::size_t i = 0; i < Ledger::kMaximumSessionsShown + 3; ++i) {
    books.push_back(ledger.openBook());
    books.back()->messages().send();
  }
  const Dictionary stats = ledger.snapshot();
  EXPECT_EQ(stats.array("sessions")->size(), Ledger::kMaximumSessionsShown);
  EXPECT_EQ(number(stats, "sessionsNotShown"), 3);
  EXPECT_EQ(number(*stats.dictionary("total")->dictionary("messages"), "sent"),
            static_cast<std::int64_t>(books.size()));
}

TEST(LedgerTest, StaysBalancedWhileSessionsComeAndGo) {
  Ledger ledger;
  constexpr int kThreads = 3;
  constexpr int kLooks = 100;
  std::atomic<int> looks = 0;
  std::atomic<std::int64_t> sessions = 0;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&] {
      for (; looks < kLooks; ++sessions) {
        const auto book = ledger.openBook();
        const auto account = book->openAccount("splunk", "https-post");
        account->hold();
        account->startHeld();
        account->finish();
      }
    });
  }
  while (looks < kLooks) {
    const Dictionary row = rowOf(*ledger.snapshot().dictionary("total"), "splunk");
    if (row.empty()) continue;
    ++looks;
    EXPECT_EQ(number(row, "accepted"), number(row, "sent") + number(row, "held") + number(row, "inFlight"));
  }
  for (auto& thread : threads) thread.join();
  const Dictionary ended = *ledger.snapshot().dictionary("ended");
  EXPECT_EQ(number(ended, "sessions"), sessions);
  EXPECT_EQ(number(rowOf(ended, "splunk"), "sent"), sessions);
}

}  // namespace
}  // namespace tallyd
