// Posts that the one transfer engine carries.

#include <gmock/gmock.h>

#include <filesystem>
#include <future>
#include <thread>

#include "HTTPClientFixture.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"

namespace tallyd::platform {

using test::LoopbackServer;
using test::RawConnection;
using test::RawServer;
using test::ReceivedRequest;
using test::ServedResponse;
using testing::HasSubstr;

namespace {

std::ptrdiff_t threadCount() {
  return std::distance(std::filesystem::directory_iterator("/proc/self/task"),
                       std::filesystem::directory_iterator());
}

constexpr const char* kEmptyResponse = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n";

}  // namespace

using AsynchronousRequestTest = HTTPClientTest;

TEST_F(AsynchronousRequestTest, StartsNoThreadBeforeTheFirstRequest) {
  const LoopbackServer server;
  static_cast<void>(
      makeClient()->sendSynchronousRequest(get(server.url())));  // The server's threads are there now.
  const auto before = threadCount();
  const auto client = makeClient();
  EXPECT_EQ(threadCount(), before);
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  completions.wait(1);
  EXPECT_EQ(threadCount(), before + 1);
}

TEST_F(AsynchronousRequestTest, SendsJustTheBytesOfThePost) {
  std::string received;
  const RawServer server([&received](RawConnection& connection) {
    received = connection.readRequest();
    connection.write(kEmptyResponse);
  });
  const auto client = makeClient();
  HTTPRequest request = get(server.url("/events"));
  request.method = "POST";
  request.headers = {{"X-RTC-Client-Name", "kiosk"},
                     {"Accept", "application/json"},
                     {"Content-Type", "application/json"},
                     {"Content-Length", "5"},
                     {"Content-Encoding", "gzip"}};
  request.body = Data(std::string("\x1f\x8b\0\xff\n", 5));
  client->sendAsynchronousRequest(request, queue, completions.next());
  EXPECT_EQ(statusOf(completions.wait(1).at(0)), 200);
  EXPECT_EQ(received,
            "POST /events HTTP/1.1\r\nHost: 127.0.0.1:" + std::to_string(server.port()) +
                "\r\nUser-Agent: tallyd\r\nX-RTC-Client-Name: kiosk\r\nAccept: application/json\r\n"
                "Content-Type: application/json\r\nContent-Encoding: gzip\r\nContent-Length: 5\r\n\r\n" +
                std::string("\x1f\x8b\0\xff\n", 5));
}

TEST_F(AsynchronousRequestTest, SendsALargeBodyWithoutAskingFirst) {
  const LoopbackServer server;
  const auto client = makeClient();
  std::string body(3'000'000, 'x');
  for (std::size_t i = 0; i < body.size(); i += 7) body[i] = static_cast<char>(i);
  client->sendAsynchronousRequest(post(server.url(), body), queue, completions.next());
  EXPECT_EQ(statusOf(completions.wait(1).at(0)), 200);
  EXPECT_TRUE(server.requests().at(0).body == body);
  EXPECT_EQ(server.requests().at(0).header("Expect"), std::nullopt);
}

TEST_F(AsynchronousRequestTest, DropsTheBodyAndKeepsTheHeaders) {
  const LoopbackServer server([](const ReceivedRequest&) {
    return ServedResponse{202, "thanks", {{"X-Receipt", "7"}}};
  });
  const auto client = makeClient();
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  const HTTPResult result = completions.wait(1).at(0);
  EXPECT_EQ(statusOf(result), 202);
  EXPECT_EQ(result.response->header("x-receipt"), "7");
  EXPECT_TRUE(result.data.empty());
}

TEST_F(AsynchronousRequestTest, CompletesOnTheGivenQueueInItsTurn) {
  const LoopbackServer server;
  Completions held;
  std::promise<void> release;
  const auto other = queues.makeSerialQueue("other");
  other->async([released = release.get_future().share()] { released.wait(); });
  const auto client = makeClient();
  client->sendAsynchronousRequest(post(server.url(), "{}"), other, held.next());
  client->sendAsynchronousRequest(post("bad url", "{}"), other, held.next());
  ASSERT_TRUE(server.waitForRequests(1));
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  completions.wait(1);
  EXPECT_TRUE(held.wait(0).empty());
  release.set_value();
  held.wait(2);
}

TEST_F(AsynchronousRequestTest, SendsFiftyPostsOneAfterAnotherOverOneConnection) {
  const LoopbackServer server;
  const auto client = makeClient();
  for (std::size_t i = 1; i <= 50; ++i) {
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
    EXPECT_EQ(statusOf(completions.wait(i).back()), 200);
  }
  EXPECT_EQ(server.connectionCount(), 1U);
}

TEST_F(AsynchronousRequestTest, SendsABurstOverFewConnections) {
  const LoopbackServer server;
  const auto client = makeClient({.maximumConnectionsPerHost = 3, .maximumActiveTransfers = 20});
  for (int i = 0; i < 100; ++i)
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  for (const HTTPResult& result : completions.wait(100)) EXPECT_EQ(statusOf(result), 200);
  EXPECT_EQ(server.requests().size(), 100U);
  EXPECT_LE(server.connectionCount(), 3U);
}

TEST_F(AsynchronousRequestTest, OutlivesConnectionsThatTheServerCloses) {
  const RawServer server([](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    connection.write(kEmptyResponse);
  });
  const auto client = makeClient();
  for (std::size_t i = 1; i <= 10; ++i) {
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
    EXPECT_EQ(statusOf(completions.wait(i).back()), 200);
  }
}

TEST_F(AsynchronousRequestTest, KeepsGoingAfterFailures) {
  const LoopbackServer server;
  const RawServer rude([](RawConnection& connection) { static_cast<void>(connection.readRequest()); });
  const RawServer garbled([](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    connection.write("nonsense\r\n\r\n");
  });
  const auto client = makeClient();
  const std::vector<std::string> failing{rude.url(), garbled.url(), "", "file:///etc/hostname",
                                         "http://127.0.0.1:1/closed"};
  std::size_t count = 0;
  for (const std::string& url : failing) {
    client->sendAsynchronousRequest(post(url, "{}"), queue, completions.next());
    EXPECT_TRUE(completions.wait(++count).back().error) << url;
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
    EXPECT_EQ(statusOf(completions.wait(++count).back()), 200) << url;
  }
}

TEST_F(AsynchronousRequestTest, FailsWhatIsUnfinishedWhenItGoesAway) {
  const RawServer server([](RawConnection& connection) { connection.waitForClose(); });
  {
    const auto client = makeClient({.maximumConnectionsPerHost = 2, .maximumActiveTransfers = 4});
    for (int i = 0; i < 10; ++i)
      client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  }
  for (const HTTPResult& result : completions.wait(10)) {
    EXPECT_THAT(errorOf(result), HasSubstr("the HTTP client is going away"));
  }
}

TEST_F(AsynchronousRequestTest, TakesRequestsFromManyThreads) {
  const LoopbackServer server;
  const auto client = makeClient();
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([&] {
      for (int i = 0; i < 25; ++i) {
        client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (const HTTPResult& result : completions.wait(100)) EXPECT_EQ(statusOf(result), 200);
}

}  // namespace tallyd::platform
