// Where redirects lead, and where they end.

#include <gmock/gmock.h>

#include "HTTPClientFixture.h"
#include "support/LoopbackServer.h"

namespace tallyd::platform {

using test::LoopbackServer;
using test::ReceivedRequest;
using test::ServedResponse;
using testing::HasSubstr;

using RedirectTest = HTTPClientTest;

namespace {

/// "/N" leads to "/N-1", and so on to "/0", which is there.
ServedResponse countDown(const ReceivedRequest& request) {
  const int left = std::stoi(request.target.substr(1));
  if (left == 0) return {200, "arrived", {{"X-Last", "yes"}}};
  return {302, "moved", {{"Location", "/" + std::to_string(left - 1)}, {"X-Moved", "yes"}}};
}

/// "/STATUS" leads to "/target" with that status.
ServedResponse redirectWithStatus(const ReceivedRequest& request) {
  if (request.target == "/target") return {200, "arrived"};
  return {std::stoi(request.target.substr(1)), "", {{"Location", "/target"}}};
}

}  // namespace

TEST_F(RedirectTest, GivesTheHeadersAndBodyOfTheLastResponse) {
  const LoopbackServer server(countDown);
  const HTTPResult result = makeClient()->sendSynchronousRequest(get(server.url("/2")));
  EXPECT_EQ(statusOf(result), 200);
  EXPECT_EQ(textOf(result), "arrived");
  ASSERT_TRUE(result.response);
  EXPECT_EQ(result.response->header("X-Last"), "yes");
  EXPECT_EQ(result.response->header("X-Moved"), std::nullopt);
}

TEST_F(RedirectTest, FollowsAtMostTenRedirects) {
  const LoopbackServer server(countDown);
  const auto client = makeClient();
  EXPECT_EQ(textOf(client->sendSynchronousRequest(get(server.url("/10")))), "arrived");
  const HTTPResult result = client->sendSynchronousRequest(get(server.url("/11")));
  EXPECT_THAT(errorOf(result), HasSubstr("redirects"));
  EXPECT_FALSE(result.response);
}

TEST_F(RedirectTest, EndsALoop) {
  const LoopbackServer server([](const ReceivedRequest&) {
    return ServedResponse{301, "", {{"Location", "/"}}};
  });
  EXPECT_TRUE(makeClient()->sendSynchronousRequest(get(server.url())).error);
  EXPECT_EQ(server.requests().size(), 11U);
}

TEST_F(RedirectTest, FollowsToNothingButHTTP) {
  for (const char* target : {"file:///etc/hostname", "ftp://127.0.0.1/", "gopher://127.0.0.1/"}) {
    const LoopbackServer server([target](const ReceivedRequest&) {
      return ServedResponse{302, "", {{"Location", target}}};
    });
    const HTTPResult result = makeClient()->sendSynchronousRequest(get(server.url()));
    EXPECT_THAT(errorOf(result), HasSubstr("not supported or disabled")) << target;
    EXPECT_TRUE(result.data.empty()) << target;
  }
}

TEST_F(RedirectTest, TurnsAPostIntoAGetAsServersExpect) {
  for (const int status : {301, 302, 303}) {
    const LoopbackServer server(redirectWithStatus);
    HTTPRequest request = post(server.url("/" + std::to_string(status)), "{\"events\":[]}");
    request.headers.emplace_back("Content-Length", "13");
    EXPECT_EQ(textOf(makeClient()->sendSynchronousRequest(request)), "arrived");
    const auto requests = server.requests();
    ASSERT_EQ(requests.size(), 2U);
    EXPECT_EQ(requests[1].method, "GET");
    EXPECT_EQ(requests[1].header("Content-Length"), std::nullopt);
  }
}

TEST_F(RedirectTest, KeepsAPostWhereTheStatusSaysSo) {
  for (const int status : {307, 308}) {
    const LoopbackServer server(redirectWithStatus);
    const auto client = makeClient();
    client->sendAsynchronousRequest(post(server.url("/" + std::to_string(status)), "{\"events\":[]}"), queue,
                                    completions.next());
    ASSERT_TRUE(server.waitForRequests(2));
    EXPECT_EQ(server.requests()[1].method, "POST");
    EXPECT_EQ(server.requests()[1].body, "{\"events\":[]}");
  }
}

}  // namespace tallyd::platform
