// Collectors that fail in every way that a network offers.

#include <gtest/gtest.h>

#include <atomic>
#include <future>

#include "faults/FaultFixture.h"
#include "support/RawServer.h"
#include "support/TLSServer.h"

namespace tallyd::test {
namespace {

constexpr int kMessages = 10;
const std::string kTaken = httpText({});

class CollectorFaultTest : public FaultFixture {
 protected:
  static constexpr int kEvents = kMessages + kRecordsOfASession;

  /// One session against the collector at `url`; the books afterwards.
  Posts sessionAgainst(TestDaemon& daemon, const std::string& url) {
    postTo(url);
    runSession(daemon, 7, kMessages);
    return settledPosts();
  }
  /// Nothing could be posted, each event is booked as that, and the daemon goes on.
  void expectAllFailed(const std::string& url, const std::string& reason) {
    TestDaemon daemon(root);
    const Posts posts = sessionAgainst(daemon, url);
    EXPECT_EQ(posts.accepted, kEvents);
    EXPECT_EQ(posts.failed, kEvents);
    EXPECT_EQ(posts.sent, 0);
    EXPECT_EQ(linesWith(daemon, "<3>Tally(sendMessage) post error: ", reason, kEvents),
              static_cast<std::size_t>(kEvents))
        << reason;
    expectServed(daemon);
  }
  void expectAllSent(const std::string& url) {
    TestDaemon daemon(root);
    const Posts posts = sessionAgainst(daemon, url);
    EXPECT_EQ(posts.accepted, kEvents);
    EXPECT_EQ(posts.sent, kEvents);
    EXPECT_EQ(posts.refused, 0);
  }
};

TEST_F(CollectorFaultTest, BooksWhatACollectorThatRefusesConnectionsDoesNotGet) {
  const int port = portOf(listenOnLoopback().get());  // Nobody listens there any more.
  expectAllFailed("http://127.0.0.1:" + std::to_string(port) + "/events", "connect");
}

TEST_F(CollectorFaultTest, BooksWhatACollectorThatResetsConnectionsDoesNotGet) {
  const RawServer server([](RawConnection& connection) { connection.reset(); });
  expectAllFailed(server.url("/events"), "127.0.0.1");
}

TEST_F(CollectorFaultTest, DoesNotSayThatAnEventWasSentWhoseAnswerNeverCame) {
  std::atomic<int> received = 0;
  const RawServer server([&received](RawConnection& connection) {
    if (!connection.readRequest().empty()) ++received;
    connection.reset();
  });
  expectAllFailed(server.url("/events"), "127.0.0.1");
  EXPECT_EQ(received, kEvents);  // Each once: a connection of its own is not tried twice.
}

TEST_F(CollectorFaultTest, WaitsForAnAnswerThatComesByteByByte) {
  std::promise<void> never;
  const std::shared_future<void> end = never.get_future().share();
  const RawServer server([end](RawConnection& connection) {
    while (!connection.readRequest().empty()) {
      for (const char byte : kTaken) {
        connection.write({&byte, 1});
        end.wait_for(std::chrono::milliseconds(1));
      }
    }
  });
  expectAllSent(server.url("/events"));
}

TEST_F(CollectorFaultTest, DelaysNobodyWhileACollectorNeverAnswers) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  {
    const RawServer silent([](RawConnection& connection) { connection.waitForClose(); });
    postTo(silent.url("/events"));
    runSession(daemon, 7, kMessages);
    statsWhen(inspection, [](const Dictionary& stats) {
      return number(rowOf(*stats.dictionary("total"), "splunk"), "inFlight") == kEvents;
    });
    expectServed(daemon);
    const Dictionary stats = statsWhen(inspection, [](const Dictionary& now) {
      return number(rowOf(*now.dictionary("total"), "splunk"), "inFlight") == kEvents;
    });
    EXPECT_EQ(postsIn(stats).failed, 0);
  }
  const Posts posts = settledPosts();
  EXPECT_EQ(posts.failed, kEvents);
  EXPECT_EQ(posts.accepted, posts.sent + posts.failed);
}

TEST_F(CollectorFaultTest, BooksAnswersThatAreErrorsAsSentAndRefused) {
  const LoopbackServer broken([](const ReceivedRequest&) { return ServedResponse{.status = 500}; });
  TestDaemon daemon(root);
  const Posts posts = sessionAgainst(daemon, broken.url("/events"));
  EXPECT_EQ(posts.sent, kEvents);
  EXPECT_EQ(posts.refused, kEvents);
  EXPECT_EQ(receivedEvents(broken).size(), static_cast<std::size_t>(kEvents));
  expectServed(daemon);
}

TEST_F(CollectorFaultTest, LosesNothingToACollectorThatClosesIdleConnections) {
  std::atomic<int> received = 0;
  const RawServer server([&received](RawConnection& connection) {
    if (connection.readRequest().empty()) return;
    ++received;
    connection.write(kTaken);
  });
  expectAllSent(server.url("/events"));
  EXPECT_EQ(received, kEvents);
}

TEST_F(CollectorFaultTest, LosesNothingToACollectorThatClosesIdleTLSConnections) {
  std::atomic<int> received = 0;
  const TLSServer server(loopbackIdentity(storebags.authority()), [&received](TLSConnection& connection) {
    if (connection.readRequest().empty()) return;
    ++received;
    connection.write(kTaken);
    connection.close();
  });
  expectAllSent(server.url("/events"));
  EXPECT_EQ(received, kEvents);
}

TEST_F(CollectorFaultTest, TellsNothingToACollectorOfAnUnknownAuthority) {
  const signing::CertificateAuthority unknown("Unknown authority");
  const LoopbackServer server(loopbackIdentity(unknown));
  expectAllFailed(server.url("/events"), "certificate");
  EXPECT_TRUE(server.requests().empty());
}

TEST_F(CollectorFaultTest, TellsNothingToACollectorWithACertificateForAnotherName) {
  const LoopbackServer server(storebags.authority().issue({"DNS:collector.example"}));
  expectAllFailed(server.url("/events"), "certificate");
  EXPECT_TRUE(server.requests().empty());
}

TEST_F(CollectorFaultTest, TellsNothingToACollectorWithACertificateThatHasExpired) {
  const LoopbackServer server(
      storebags.authority().issue({"DNS:localhost", "IP:127.0.0.1"}, signing::Validity::Expired));
  expectAllFailed(server.url("/events"), "certificate has expired");
  EXPECT_TRUE(server.requests().empty());
}

TEST_F(CollectorFaultTest, BooksWhatHasNoAddress) {
  expectAllFailed("http://" + kUnresolvableHost + "/events", "Could not resolve host: " + kUnresolvableHost);
}

TEST_F(CollectorFaultTest, ServesTheSessionThatACollectorFailsAsSoonAsItIsBack) {
  std::atomic<bool> isBack = false;
  const RawServer server([&isBack](RawConnection& connection) {
    while (isBack && !connection.readRequest().empty()) connection.write(kTaken);
  });
  postTo(server.url("/events"));
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  const auto session = startedSession(daemon, sessionInfo(7));
  sendMessages(*session, kMessages);
  statsWhen(inspection, [](const Dictionary& stats) { return postsIn(stats).failed == 1 + kMessages; });
  isBack = true;
  sendMessages(*session, kMessages);
  const Dictionary stats =
      statsWhen(inspection, [](const Dictionary& now) { return postsIn(now).sent == kMessages; });
  EXPECT_EQ(postsIn(stats).failed, 1 + kMessages);
}

}  // namespace
}  // namespace tallyd::test
