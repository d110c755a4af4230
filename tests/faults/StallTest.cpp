// Servers that stop in the middle, with limits of a second where the daemon's own are a minute: no option
// shortens those, so that this is the HTTP client alone, on real sockets.

#include <gmock/gmock.h>

#include <future>

#include "support/LoopbackServer.h"
#include "support/RawServer.h"
#include "unit/platform/http/HTTPClientFixture.h"

namespace tallyd::platform {

using namespace std::chrono_literals;
using test::RawConnection;
using test::RawServer;
using testing::HasSubstr;

namespace {

using StallTest = HTTPClientTest;

/// All at once, as each takes its time: libcurl looks at the speed of the last seconds.
TEST_F(StallTest, GivesUpOnServersThatStopAnywhereAndDelaysNoPostToAnother) {
  std::promise<void> end;
  const std::shared_future<void> ended = end.get_future().share();
  {
    const RawServer neverReads([ended](RawConnection&) { ended.wait(); });
    const RawServer stopsReading([ended](RawConnection& connection) {
      static_cast<void>(connection.waitForBytes());
      ended.wait();
    });
    const RawServer neverAnswers([](RawConnection& connection) { connection.waitForClose(); });
    const RawServer stopsAnswering([](RawConnection& connection) {
      static_cast<void>(connection.readRequest());
      connection.write("HTTP/1.1 200 O");
      connection.waitForClose();
    });
    const test::LoopbackServer good;
    Completions served;
    const auto client = makeClient({.stallTime = 1s});
    for (const RawServer* server : {&neverReads, &stopsReading, &neverAnswers, &stopsAnswering}) {
      client->sendAsynchronousRequest(post(server->url(), std::string(16'000'000, 'x')), queue,
                                      completions.next());
      client->sendAsynchronousRequest(post(good.url(), "{}"), queue, served.next());
    }
    for (const HTTPResult& result : served.wait(4)) EXPECT_EQ(errorOf(result), "no error");
    EXPECT_TRUE(completions.wait(0).empty());
    for (const HTTPResult& result : completions.wait(4)) EXPECT_THAT(errorOf(result), HasSubstr("too slow"));
    end.set_value();
  }
}

TEST_F(StallTest, WaitsForAnAnswerThatMovesOnHoweverSlowly) {
  std::promise<void> never;
  const std::shared_future<void> end = never.get_future().share();
  const RawServer server([end](RawConnection& connection) {
    static_cast<void>(connection.readRequest());
    // Twice as long as a stall may last, and never as long as one without a byte.
    for (const char byte : std::string_view("HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n")) {
      connection.write({&byte, 1});
      end.wait_for(60ms);
    }
  });
  const auto client = makeClient({.stallTime = 1s});
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  EXPECT_EQ(errorOf(completions.wait(1).at(0)), "no error");
}

}  // namespace
}  // namespace tallyd::platform
