// Failures that may pass, and those that would come again.

#include "HTTPClientFixture.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"

namespace tallyd::platform {

using test::LoopbackServer;
using test::RawConnection;
using test::RawServer;
using test::ReceivedRequest;
using test::ServedResponse;

class FailureKindTest : public HTTPClientTest {
 protected:
  /// Of a post to this URL, which is the same for a synchronous one.
  HTTPFailure kindOf(const std::string& url, const HTTPLimits& limits = {}) {
    const auto client = makeClient(limits);
    Completions completed;
    client->sendAsynchronousRequest(post(url, "{}"), queue, completed.next());
    const HTTPResult result = completed.wait(1).at(0);
    EXPECT_TRUE(result.error);
    EXPECT_EQ(client->sendSynchronousRequest(post(url, "{}")).failure, result.failure);
    return result.failure;
  }
};

TEST_F(FailureKindTest, ARequestThatCannotBeMadeFailsForGood) {
  for (const char* url : {"", "collect.example/in", "ftp://127.0.0.1/in", "http://"}) {
    EXPECT_EQ(kindOf(url), HTTPFailure::Permanent) << url;
  }
}

TEST_F(FailureKindTest, TooManyRedirectsAndTooLargeAnAnswerAreFailuresForGood) {
  const LoopbackServer circle([](const ReceivedRequest&) {
    return ServedResponse{302, "", {{"Location", "/"}}};
  });
  EXPECT_EQ(kindOf(circle.url()), HTTPFailure::Permanent);
  const LoopbackServer talkative([](const ReceivedRequest&) {
    return ServedResponse{200, std::string(5'000, 'x')};
  });
  EXPECT_EQ(kindOf(talkative.url(), {.maximumResponseBytes = 1'000}), HTTPFailure::Permanent);
}

TEST_F(FailureKindTest, ATransferThatBreaksMayDoBetterNextTime) {
  const RawServer rude([](RawConnection& connection) { static_cast<void>(connection.readRequest()); });
  EXPECT_EQ(kindOf(rude.url()), HTTPFailure::Transfer);
  std::string closed;
  {
    const RawServer gone([](RawConnection&) {});
    closed = gone.url();
  }
  EXPECT_EQ(kindOf(closed), HTTPFailure::Transfer);
}

}  // namespace tallyd::platform
