// Bounds of time and memory.

#include <gmock/gmock.h>

#include "HTTPClientFixture.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"

namespace tallyd::platform {

using namespace std::chrono_literals;
using test::LoopbackServer;
using test::RawConnection;
using test::RawServer;
using test::ReceivedRequest;
using test::ServedResponse;
using testing::AnyOf;
using testing::HasSubstr;

namespace {

void neverAnswer(RawConnection& connection) { connection.waitForClose(); }

}  // namespace

using RequestLimitsTest = HTTPClientTest;

TEST_F(RequestLimitsTest, EndsASynchronousRequestAtItsTimeout) {
  const RawServer server(neverAnswer);
  HTTPRequest request = get(server.url());
  request.timeout = 50ms;
  EXPECT_THAT(errorOf(makeClient()->sendSynchronousRequest(request)), HasSubstr("timed out"));
}

TEST_F(RequestLimitsTest, EndsAnAsynchronousRequestAtItsTimeout) {
  const RawServer server(neverAnswer);
  const auto client = makeClient();
  HTTPRequest request = post(server.url(), "{}");
  request.timeout = 50ms;
  client->sendAsynchronousRequest(request, queue, completions.next());
  EXPECT_THAT(errorOf(completions.wait(1).at(0)), HasSubstr("timed out"));
}

TEST_F(RequestLimitsTest, GivesUpWithoutProgress) {
  const RawServer server([](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc");
    connection.waitForClose();
  });
  const auto client = makeClient({.stallTime = 1s});
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  EXPECT_THAT(errorOf(client->sendSynchronousRequest(get(server.url()))), HasSubstr("too slow"));
  EXPECT_THAT(errorOf(completions.wait(1).at(0)), HasSubstr("too slow"));
}

TEST_F(RequestLimitsTest, GivesUpWaitingForAConnection) {
  const RawServer server(neverAnswer);
  const auto client =
      makeClient({.stallTime = 1s, .maximumConnectionsPerHost = 1, .maximumActiveTransfers = 2});
  for (int i = 0; i < 4; ++i)
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  int withoutConnection = 0;
  for (const HTTPResult& result : completions.wait(4)) {
    ASSERT_THAT(errorOf(result),
                AnyOf(HasSubstr("no connection became free in time"), HasSubstr("too slow")));
    withoutConnection += errorOf(result).starts_with("no connection") ? 1 : 0;
  }
  EXPECT_GE(withoutConnection, 1);
}

TEST_F(RequestLimitsTest, TakesAResponseUpToItsBoundAndNoLarger) {
  const LoopbackServer server([](const ReceivedRequest& request) {
    return ServedResponse{200, std::string(std::stoul(request.target.substr(1)), 'x')};
  });
  const auto client = makeClient({.maximumResponseBytes = 100'000});
  EXPECT_EQ(client->sendSynchronousRequest(get(server.url("/99000"))).data.size(), 99'000U);
  const HTTPResult large = client->sendSynchronousRequest(get(server.url("/100001")));
  EXPECT_THAT(errorOf(large), HasSubstr("response of more than 100000 bytes"));
  EXPECT_FALSE(large.response);
  EXPECT_TRUE(large.data.empty());
}

TEST_F(RequestLimitsTest, BoundsResponsesThatAreDroppedToo) {
  const RawServer server([](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    connection.write("HTTP/1.1 200 OK\r\n\r\n" + std::string(1'000'000, 'x'));
    connection.waitForClose();
  });
  const auto client = makeClient({.maximumResponseBytes = 10'000});
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  EXPECT_THAT(errorOf(completions.wait(1).at(0)), HasSubstr("response of more than 10000 bytes"));
}

TEST_F(RequestLimitsTest, BoundsHeadersToo) {
  const RawServer server([](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    connection.write("HTTP/1.1 200 OK\r\n");
    for (int i = 0; i < 1000; ++i) connection.write("X-More: " + std::string(50, 'x') + "\r\n");
    connection.write("Content-Length: 0\r\n\r\n");
    connection.waitForClose();
  });
  EXPECT_THAT(
      errorOf(makeClient({.maximumResponseBytes = 10'000})->sendSynchronousRequest(get(server.url()))),
      HasSubstr("response of more than 10000 bytes"));
}

TEST_F(RequestLimitsTest, FailsTheNewestRequestPastTheMemoryBound) {
  const RawServer server(neverAnswer);
  Completions refused;
  {
    const auto client = makeClient({.maximumPendingBytes = 250'000});
    for (int i = 0; i < 2; ++i) {
      client->sendAsynchronousRequest(post(server.url(), std::string(100'000, 'x')), queue,
                                      completions.next());
    }
    client->sendAsynchronousRequest(post(server.url(), std::string(100'000, 'x')), queue, refused.next());
    EXPECT_THAT(errorOf(refused.wait(1).at(0)), HasSubstr("too many unfinished requests"));
    EXPECT_TRUE(completions.wait(0).empty());
  }
  completions.wait(2);
}

TEST_F(RequestLimitsTest, FreesTheMemoryOfFinishedRequests) {
  const LoopbackServer server;
  const auto client = makeClient({.maximumPendingBytes = 150'000});
  for (std::size_t i = 1; i <= 5; ++i) {
    client->sendAsynchronousRequest(post(server.url(), std::string(100'000, 'x')), queue, completions.next());
    EXPECT_EQ(errorOf(completions.wait(i).back()), "no error");
  }
}

}  // namespace tallyd::platform
