// Requests that are waited for.

#include <gmock/gmock.h>

#include <atomic>
#include <thread>

#include "HTTPClientFixture.h"
#include "fakes/FakeQueues.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"

namespace tallyd::platform {

using test::LoopbackServer;
using test::RawConnection;
using test::RawServer;
using test::ReceivedRequest;
using test::ServedResponse;
using testing::HasSubstr;
using testing::Not;

using SynchronousRequestTest = HTTPClientTest;

TEST_F(SynchronousRequestTest, ReturnsStatusHeadersAndBody) {
  const LoopbackServer server([](const ReceivedRequest&) {
    return ServedResponse{200, "a bag", {{"Cache-Control", "max-age=600"}}};
  });
  const auto client = makeClient();
  const HTTPResult result =
      client->sendSynchronousRequest(get(server.url("/bags/sorrel/playhall?version=6.21")));
  EXPECT_EQ(result.error, std::nullopt);
  ASSERT_TRUE(result.response);
  EXPECT_EQ(result.response->status, 200);
  EXPECT_EQ(result.response->header("cache-control"), "max-age=600");
  EXPECT_EQ(textOf(result), "a bag");
  EXPECT_EQ(server.requests().at(0).target, "/bags/sorrel/playhall?version=6.21");
}

TEST_F(SynchronousRequestTest, SendsAPlainGetWithoutBody) {
  std::string received;
  RawServer server([&received](RawConnection& connection) {
    received = connection.readRequest();
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
  });
  static_cast<void>(makeClient()->sendSynchronousRequest(get(server.url("/bags/(null)?version=6.21"))));
  EXPECT_EQ(received, "GET /bags/(null)?version=6.21 HTTP/1.1\r\nHost: 127.0.0.1:" +
                          std::to_string(server.port()) + "\r\nUser-Agent: tallyd\r\nAccept: */*\r\n\r\n");
}

TEST_F(SynchronousRequestTest, TreatsAnEmptyBodyAndAnErrorStatusAsResponses) {
  const LoopbackServer server([](const ReceivedRequest&) { return ServedResponse{503}; });
  const HTTPResult result = makeClient()->sendSynchronousRequest(get(server.url()));
  EXPECT_EQ(result.error, std::nullopt);
  EXPECT_EQ(statusOf(result), 503);
  EXPECT_TRUE(result.data.empty());
}

TEST_F(SynchronousRequestTest, TellsCachesToFetchAnew) {
  const LoopbackServer server;
  const auto client = makeClient();
  HTTPRequest request = get(server.url());
  static_cast<void>(client->sendSynchronousRequest(request));
  request.cachePolicy = CachePolicy::ReloadIgnoringCache;
  static_cast<void>(client->sendSynchronousRequest(request));
  EXPECT_EQ(server.requests().at(0).header("Cache-Control"), std::nullopt);
  EXPECT_EQ(server.requests().at(1).header("Cache-Control"), "no-cache");
  EXPECT_EQ(server.requests().at(1).header("Pragma"), "no-cache");
}

TEST_F(SynchronousRequestTest, RefusesURLsThatAreNotHTTP) {
  const auto client = makeClient();
  for (const char* url :
       {"", "not a url", "127.0.0.1/x", "file:///etc/passwd", "ftp://127.0.0.1/x", "http://", "://"}) {
    const HTTPResult result = client->sendSynchronousRequest(get(url));
    EXPECT_TRUE(result.error) << url;
    EXPECT_FALSE(result.response) << url;
  }
}

TEST_F(SynchronousRequestTest, RefusesABodyInAGet) {
  const LoopbackServer server;
  HTTPRequest request = get(server.url());
  request.body = Data("body");
  EXPECT_THAT(errorOf(makeClient()->sendSynchronousRequest(request)), HasSubstr("can't carry a body"));
  EXPECT_TRUE(server.requests().empty());
}

TEST_F(SynchronousRequestTest, LetsNoHeaderOrMethodSmuggleLines) {
  std::string received;
  RawServer server([&received](RawConnection& connection) {
    received = connection.readRequest();
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
  });
  const auto client = makeClient();
  HTTPRequest request = get(server.url());
  request.headers = {{"X-Client", "name\r\nX-Smuggled: 1"}, {"X-Empty", ""}};
  EXPECT_EQ(client->sendSynchronousRequest(request).error, std::nullopt);
  EXPECT_THAT(received, HasSubstr("\r\nX-Client: name  X-Smuggled: 1\r\n"));
  EXPECT_THAT(received, HasSubstr("\r\nX-Empty:\r\n"));

  request.headers = {{"X-Client: a\r\nX-Smuggled", "1"}};
  EXPECT_TRUE(client->sendSynchronousRequest(request).error);
  request.headers.clear();
  request.method = "GET / HTTP/1.1\r\nX-Smuggled: 1\r\n";
  EXPECT_TRUE(client->sendSynchronousRequest(request).error);
}

TEST_F(SynchronousRequestTest, NamesTheURLButNoSecretsInErrors) {
  int closedPort = 0;
  { closedPort = test::portOf(test::listenOnLoopback().get()); }
  const std::string host = "127.0.0.1:" + std::to_string(closedPort);
  const std::string error = errorOf(
      makeClient()->sendSynchronousRequest(get("http://user:password@" + host + "/path?secret=1#fragment")));
  EXPECT_THAT(error, HasSubstr("http://" + host + "/path)"));
  EXPECT_THAT(error, Not(HasSubstr("secret")));
  EXPECT_THAT(error, Not(HasSubstr("password")));
  EXPECT_THAT(error, Not(HasSubstr("user")));
  EXPECT_THAT(error, Not(HasSubstr("fragment")));
}

TEST_F(SynchronousRequestTest, MarksTheWaitAsBlocking) {
  const LoopbackServer server;
  fakes::FakeQueues countingQueues;
  CurlHTTPClient client(Root(folder.path()), countingQueues, log);
  static_cast<void>(client.sendSynchronousRequest(get(server.url())));
  EXPECT_EQ(countingQueues.blockingCalls, 1U);
}

TEST_F(SynchronousRequestTest, ReusesItsConnection) {
  const LoopbackServer server;
  const auto client = makeClient();
  for (int i = 0; i < 10; ++i) EXPECT_EQ(statusOf(client->sendSynchronousRequest(get(server.url()))), 200);
  EXPECT_EQ(server.connectionCount(), 1U);
}

TEST_F(SynchronousRequestTest, IsNotChangedByTheRequestBeforeIt) {
  const LoopbackServer server;
  const RawServer silent([](RawConnection& connection) { connection.waitForClose(); });
  const auto client = makeClient({.stallTime = std::chrono::seconds(1)});
  HTTPRequest hurried = post(silent.url(), "{}");
  hurried.timeout = std::chrono::milliseconds(50);
  EXPECT_THAT(errorOf(client->sendSynchronousRequest(hurried)), HasSubstr("timed out"));
  EXPECT_THAT(errorOf(client->sendSynchronousRequest(get(silent.url()))), HasSubstr("too slow"));

  const std::vector<std::pair<std::string, std::string>> requests{
      {"PUT", "a file"}, {"GET", ""},  {"DELETE", ""}, {"POST", "events"},
      {"HEAD", ""},      {"POST", ""}, {"GET", ""}};
  for (const auto& [method, body] : requests) {
    HTTPRequest request = get(server.url());
    request.method = method;
    request.body = Data(body);
    if (method == "PUT") request.headers = {{"X-Once", "1"}};
    EXPECT_EQ(statusOf(client->sendSynchronousRequest(request)), 200) << method;
    const ReceivedRequest received = server.requests().back();
    EXPECT_EQ(received.method, method);
    EXPECT_EQ(received.body, body) << method;
    EXPECT_EQ(received.header("X-Once").has_value(), method == "PUT") << method;
  }
}

TEST_F(SynchronousRequestTest, ServesManyThreadsAtOnce) {
  const LoopbackServer server([](const ReceivedRequest& request) {
    return ServedResponse{200, request.target};
  });
  const auto client = makeClient();
  std::atomic<int> right{0};
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 12; ++thread) {
    threads.emplace_back([&, thread] {
      for (int i = 0; i < 10; ++i) {
        const std::string path = "/" + std::to_string(thread) + "/" + std::to_string(i);
        if (textOf(client->sendSynchronousRequest(get(server.url(path)))) == path) ++right;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(right, 120);
}

}  // namespace tallyd::platform
