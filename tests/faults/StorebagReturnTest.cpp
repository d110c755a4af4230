// Storebag servers that fail in every way and are well again: the real daemon tells its client at once, asks
// again after 900 s, which pass in no time here, and reports.

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "faults/ShiftedTime.h"
#include "faults/StorebagFaultFixture.h"

namespace tallyd::test {
namespace {

using std::chrono::seconds;

class StorebagReturnTest : public StorebagFaultFixture {
 protected:
  /// A line of the daemon's.
  struct Line {
    std::string start;
    std::string part{};
  };

  /// A server that misbehaves until it is well.
  [[nodiscard]] TLSServer::Script wellOr(TLSServer::Script misbehave) {
    return serveWith([this, good = goodText(), misbehave = std::move(misbehave)](TLSConnection& connection) {
      if (!isWell) return misbehave(connection);
      connection.write(good);
      connection.close();
    });
  }
  /// A client is told that there is no storebag and the log says why; once the server is well and 900 s have
  /// passed since it was asked, the next client gets the storebag and everything that it reports is posted.
  void expectReturn(const TLSServer& server, const Line& reason) {
    useServer(server);
    TestDaemon daemon(root, {.environment = time.environment()});
    expectNoStorebag(daemon);
    EXPECT_EQ(linesWith(daemon, reason.start, reason.part, 1), 1U) << reason.start << reason.part;
    EXPECT_EQ(daemon.process().countOnce("<2>Could not fetch storebag for client type 6", 1), 1U);

    makeWell();
    isWell = true;
    time.advance(kMuchOfTheWait);
    EXPECT_EQ(startedBackends(daemon), std::nullopt);
    EXPECT_EQ(daemon.process().countOnce("<6>Not fetching storebag for client type 6 - must wait 900 seconds "
                                         "between attempts",
                                         1),
              1U);
    time.advance(kWait - kMuchOfTheWait);
    EXPECT_EQ(startedBackends(daemon), std::vector<std::string>{"splunk"});
    const Posts posts = settledPosts();
    EXPECT_EQ(posts.accepted, kMessages + kRecordsOfASession);
    EXPECT_EQ(posts.sent, posts.accepted);
    EXPECT_EQ(receivedEvents(collector).size(), static_cast<std::size_t>(posts.accepted));
  }

  [[nodiscard]] signing::TLSIdentity goodIdentity() const { return loopbackIdentity(storebags.authority()); }

  static constexpr const char* kRequestError = "<2>sendSynchronousRequest error ";
  std::atomic<bool> isWell = false;
  std::function<void()> makeWell = [] {};  ///< What else it takes.
  ShiftedTime time;

 private:
  static constexpr seconds kWait{900};
  static constexpr seconds kMuchOfTheWait{800};  ///< Real time passes too.
  static constexpr int kMessages = 3;

  /// What a session of the client type that was without a storebag starts with; it sends its messages.
  std::optional<std::vector<std::string>> startedBackends(TestDaemon& daemon) {
    const auto session = daemon.connect();
    session->setSessionInfoSync(sessionInfo(9, kMisservedType), Dictionary{{"ClientName", "demo"}});
    auto backends = session->startConfigSync().value;
    sendMessages(*session, kMessages);
    return backends;
  }
};

TEST_F(StorebagReturnTest, ReportsAgainAfterHalfABody) {
  const TLSServer server(goodIdentity(), wellOr([half = brokenOffText()](TLSConnection& connection) {
                           connection.write(half);
                           connection.close();
                         }));
  expectReturn(server, {kRequestError, "bytes remaining to read"});
}

TEST_F(StorebagReturnTest, ReportsAgainAfterABodyOfAGibibyte) {
  std::atomic<std::size_t> written = 0;
  const TLSServer server(
      goodIdentity(), wellOr([&written](TLSConnection& connection) { writeGibibyte(connection, written); }));
  expectReturn(server, {kRequestError, "response of more than 16777216 bytes"});
  EXPECT_LT(written, kGibibyte / 16);
}

TEST_F(StorebagReturnTest, ReportsAgainAfterASignatureOfAnotherKey) {
  const TLSServer server(goodIdentity(), wellOr([forged = forgedText()](TLSConnection& connection) {
                           connection.write(forged);
                           connection.close();
                         }));
  expectReturn(server, {"<2>Signature can not be verified, 0x"});
}

TEST_F(StorebagReturnTest, ReportsAgainAfterACertificateThatHadExpired) {
  TLSServer server(
      storebags.authority().issue({"DNS:localhost", "IP:127.0.0.1"}, signing::Validity::Expired),
      wellOr([](TLSConnection&) { ADD_FAILURE() << "a server that is not to be believed was asked"; }));
  makeWell = [&] { server.setIdentity(goodIdentity()); };
  expectReturn(server, {kRequestError, "certificate has expired"});
}

/// A process keeps the base URL that it has read once: the name is that of the server that this one sends to.
TEST_F(StorebagReturnTest, ReportsAgainAfterANameThatDidNotResolve) {
  const std::string redirect =
      httpText({.status = 302, .headers = {{"Location", "https://" + kUnresolvableHost + "/bags"}}});
  const TLSServer server(goodIdentity(), wellOr([redirect](TLSConnection& connection) {
                           connection.write(redirect);
                           connection.close();
                         }));
  expectReturn(server, {kRequestError, "Could not resolve host: " + kUnresolvableHost});
}

/// The one test that waits for what passes in real time: the time for a storebag's request is 15 s.
TEST_F(StorebagReturnTest, ReportsAgainAfterAServerThatHung) {
  const TLSServer server(goodIdentity(),
                         wellOr([](TLSConnection& connection) { connection.waitForClose(); }));
  const auto start = std::chrono::steady_clock::now();
  expectReturn(server, {kRequestError, "timed out after "});
  EXPECT_GE(std::chrono::steady_clock::now() - start, seconds(15));
}

}  // namespace
}  // namespace tallyd::test
