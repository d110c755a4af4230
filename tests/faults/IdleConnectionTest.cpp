// Servers that close connections while nothing is under way, as all do after a while: no request may be lost
// to that.

#include <gmock/gmock.h>
#include <sys/socket.h>

#include <atomic>
#include <fstream>
#include <future>

#include "signing/CertificateAuthority.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"
#include "support/TLSServer.h"
#include "unit/platform/http/HTTPClientFixture.h"

namespace tallyd::platform {

using test::loopbackIdentity;
using test::RawConnection;
using test::RawServer;
using test::TLSConnection;
using test::TLSServer;

namespace {

constexpr std::string_view kTaken = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n";
/// More than sockets and TLS records take at once: part of it is still to be sent when the connection proves
/// dead.
constexpr std::size_t kLargeBody = 16'000'000;

std::string bodyOf(const std::string& request) { return request.substr(request.find("\r\n\r\n") + 4); }

class IdleConnectionTest : public HTTPClientTest {
 protected:
  IdleConnectionTest() {
    const auto file = folder.path() / "etc/tally/ca.pem";
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file) << authority.certificatePEM();
  }

  /// Answers the first request, then closes; serves every later connection.
  template <class Connection>
  void closeFirstWhenIdle(Connection& connection, const std::function<void()>& close) {
    if (connection.number() == 1) {
      static_cast<void>(connection.readRequest());
      connection.write(kTaken);
      // The client has the answer before the connection ends: it goes back to the idle ones.
      answered.get_future().wait();
      close();
      closed.set_value();
      return;
    }
    const std::string request = connection.readRequest();
    if (request.empty()) return;
    received.set_value(bodyOf(request));
    connection.write(kTaken);
    connection.waitForClose();
  }

  void postTwice(const std::string& url, std::size_t size) {
    const auto client = makeClient();
    client->sendAsynchronousRequest(post(url, "first"), queue, completions.next());
    EXPECT_EQ(errorOf(completions.wait(1).at(0)), "no error");
    answered.set_value();
    closed.get_future().wait();
    const std::string body(size, 'x');
    client->sendAsynchronousRequest(post(url, body), queue, completions.next());
    EXPECT_EQ(errorOf(completions.wait(2).at(1)), "no error");
    expectReceived(body);
  }
  void sendTwiceSynchronously(const std::string& url, std::size_t size) {
    const auto client = makeClient();
    EXPECT_EQ(errorOf(client->sendSynchronousRequest(post(url, "first"))), "no error");
    answered.set_value();
    closed.get_future().wait();
    const std::string body(size, 'x');
    EXPECT_EQ(errorOf(client->sendSynchronousRequest(post(url, body))), "no error");
    expectReceived(body);
  }
  void expectReceived(const std::string& body) {
    auto arrival = received.get_future();
    ASSERT_EQ(arrival.wait_for(std::chrono::seconds(0)), std::future_status::ready);
    EXPECT_TRUE(arrival.get() == body) << "another body";
  }

  const signing::CertificateAuthority authority{"Test authority"};
  std::promise<void> answered;
  std::promise<void> closed;
  std::promise<std::string> received;
  TLSServer tlsServer{loopbackIdentity(authority), [this](TLSConnection& connection) {
                        closeFirstWhenIdle(connection, [&] { connection.close(); });
                      }};
  RawServer plainServer{[this](RawConnection& connection) {
    closeFirstWhenIdle(connection, [&] { ::shutdown(connection.descriptor(), SHUT_RDWR); });
  }};
};

TEST_F(IdleConnectionTest, ASmallPostSurvivesAPlainConnectionThatWasClosed) {
  postTwice(plainServer.url(), 5);
  EXPECT_EQ(plainServer.connectionCount(), 2);
}

TEST_F(IdleConnectionTest, ALargePostSurvivesAPlainConnectionThatWasClosed) {
  postTwice(plainServer.url(), kLargeBody);
  EXPECT_EQ(plainServer.connectionCount(), 2);
}

TEST_F(IdleConnectionTest, ASmallPostSurvivesATLSConnectionThatWasClosed) {
  postTwice(tlsServer.url(), 5);
  EXPECT_EQ(tlsServer.connectionCount(), 2);
}

TEST_F(IdleConnectionTest, ALargePostSurvivesATLSConnectionThatWasClosed) {
  postTwice(tlsServer.url(), kLargeBody);
  EXPECT_EQ(tlsServer.connectionCount(), 2);
}

TEST_F(IdleConnectionTest, ASynchronousRequestSurvivesAPlainConnectionThatWasClosed) {
  sendTwiceSynchronously(plainServer.url(), kLargeBody);
}

TEST_F(IdleConnectionTest, ASynchronousRequestSurvivesATLSConnectionThatWasClosed) {
  sendTwiceSynchronously(tlsServer.url(), kLargeBody);
}

/// A server whose patience with an idle connection ends just when the next request comes: it takes a first
/// request and hangs up at the start of a second one.
template <class Connection>
void hangUpOnTheSecond(Connection& connection, const std::function<void()>& hangUp) {
  const std::string request = connection.readRequest();
  if (request.empty()) return;
  connection.write(kTaken);
  if (!connection.waitForBytes()) return;
  hangUp();
}

/// The moment decides whether the client finds that it can't send or that it can't receive; enough rounds
/// bring both.
constexpr std::size_t kRounds = 30;
constexpr std::size_t kRoundBody = 4'000'000;

class HangUpTest : public IdleConnectionTest {
 protected:
  void postRounds(const std::string& url) {
    const auto client = makeClient();
    for (std::size_t i = 0; i < kRounds; ++i) {
      const std::size_t size = i % 2 == 0 ? 5 : kRoundBody;
      client->sendAsynchronousRequest(post(url, std::string(size, 'x')), queue, completions.next());
      EXPECT_EQ(errorOf(completions.wait(i + 1).back()), "no error") << i;
    }
  }
  void sendRoundsSynchronously(const std::string& url) {
    const auto client = makeClient();
    for (std::size_t i = 0; i < kRounds; ++i) {
      const std::size_t size = i % 2 == 0 ? 5 : kRoundBody;
      EXPECT_EQ(errorOf(client->sendSynchronousRequest(post(url, std::string(size, 'x')))), "no error") << i;
    }
  }

  TLSServer tls{loopbackIdentity(authority), [](TLSConnection& connection) {
                  hangUpOnTheSecond(connection, [&] { connection.reset(); });
                }};
  RawServer plain{
      [](RawConnection& connection) { hangUpOnTheSecond(connection, [&] { connection.reset(); }); }};
};

TEST_F(HangUpTest, NoPostIsLostToATLSServerThatHangsUpAsTheNextOneComes) { postRounds(tls.url()); }

TEST_F(HangUpTest, NoPostIsLostToAPlainServerThatHangsUpAsTheNextOneComes) { postRounds(plain.url()); }

TEST_F(HangUpTest, NoSynchronousRequestIsLostToATLSServerThatHangsUpAsTheNextOneComes) {
  sendRoundsSynchronously(tls.url());
}

TEST_F(HangUpTest, NoSynchronousRequestIsLostToAPlainServerThatHangsUpAsTheNextOneComes) {
  sendRoundsSynchronously(plain.url());
}

TEST_F(IdleConnectionTest, ANewConnectionThatDiesIsNotTriedAgain) {
  const RawServer server([](RawConnection& connection) { connection.reset(); });
  const auto client = makeClient();
  client->sendAsynchronousRequest(post(server.url(), std::string(kLargeBody, 'x')), queue,
                                  completions.next());
  EXPECT_NE(errorOf(completions.wait(1).at(0)), "no error");
  EXPECT_NE(errorOf(client->sendSynchronousRequest(post(server.url(), std::string(kLargeBody, 'x')))),
            "no error");
  EXPECT_EQ(server.connectionCount(), 2);
}

}  // namespace
}  // namespace tallyd::platform
