// Clocks that jump, as those of devices do that start without one and then learn the time, or lose it. The
// time of day comes from the Clock, which stands in the test's hands here; whatever waits (timers, the HTTP
// client's limits) goes by the steady clock, which never jumps.

#include <gtest/gtest.h>

#include <fstream>

#include "fakes/SignedStorebag.h"
#include "storebag/StorebagCache.h"
#include "support/MessageLog.h"
#include "unit/backends/https-post/HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

using platform::Dictionary;
using platform::Value;
using std::chrono::hours;
using std::chrono::seconds;

constexpr hours kTenYears{24 * 3652};

class ClockJumpTest : public HTTPSPostBackendFixture {
 protected:
  ClockJumpTest() {
    fake.clock.set(std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::system_clock::now().time_since_epoch()));
  }
  [[nodiscard]] std::size_t lineCount() const {
    std::size_t lines = 0;
    for (const auto& entry : std::filesystem::directory_iterator(
             fake.root.under("/var/mobile/Library/Logs/CrashReporter/Retired"))) {
      std::ifstream file(entry.path());
      for (std::string line; std::getline(file, line);) ++lines;
    }
    return lines;
  }
};

TEST_F(ClockJumpTest, TheMessageLogLosesNoLineToAClockSetBack) {
  MessageLog log(fake.platform);
  log.writeMessageLog("before");
  fake.clock.advance(-kTenYears);
  log.writeMessageLog("after");
  EXPECT_EQ(lineCount(), 2U);
}

TEST_F(ClockJumpTest, TheMessageLogBeginsAnewAfterAClockSetForward) {
  MessageLog log(fake.platform);
  log.writeMessageLog("before");
  fake.clock.advance(kTenYears);
  log.writeMessageLog("after");
  EXPECT_EQ(lineCount(), 1U);
  // The file was made at the true time, and is taken for an old one as long as the clock is wrong: the diary
  // holds the last line only, and goes on by itself once the clock is right.
  fake.clock.advance(-kTenYears);
  log.writeMessageLog("right again");
  log.writeMessageLog("and on");
  EXPECT_EQ(lineCount(), 3U);
}

TEST_F(ClockJumpTest, TheStorebagCacheServesThroughJumpsAndFetchesOnceForEach) {
  fake.frameworkBundle.resources["publicKey.der"] = fakes::StorebagSigner::server().subjectPublicKeyInfo();
  const std::string body = fakes::StorebagSigner::server().envelope(
      Dictionary{{"version", "1"}, {"release", Dictionary{{"splunk", Dictionary()}}}});
  fake.http.answer = [&](const auto&) {
    return fakes::FakeHTTPClient::ok(body, {{"Cache-Control", "max-age=600"}});
  };
  StorebagCache cache(fake.platform);
  EXPECT_TRUE(cache.storebag(1, 5));
  std::size_t fetches = 1;
  for (const hours jump : {kTenYears, -2 * kTenYears, kTenYears}) {
    fake.clock.advance(jump);
    for (int i = 0; i < 3; ++i) {
      EXPECT_TRUE(cache.storebag(1, 5));
      fake.clock.advance(seconds(10));
    }
    EXPECT_EQ(fake.http.synchronousRequests().size(), ++fetches);
  }
}

TEST_F(ClockJumpTest, AFailedFetchIsTriedAgainAfterAJumpToEitherSide) {
  fake.http.answer = [](const auto&) { return fakes::FakeHTTPClient::failure("down"); };
  StorebagCache cache(fake.platform);
  EXPECT_FALSE(cache.storebag(1, 5));
  std::size_t fetches = 1;
  for (const hours jump : {-kTenYears, kTenYears}) {
    EXPECT_FALSE(cache.storebag(1, 5));
    EXPECT_EQ(fake.http.synchronousRequests().size(), fetches) << "it waits";
    fake.clock.advance(jump);
    EXPECT_FALSE(cache.storebag(1, 5));
    EXPECT_EQ(fake.http.synchronousRequests().size(), ++fetches);
  }
}

TEST_F(ClockJumpTest, PostsGoOnWithTheTimeThatIsTold) {
  const auto backend = evaluated();
  std::size_t posts = postCount();
  for (const hours jump : {hours(0), kTenYears, -2 * kTenYears}) {
    fake.clock.advance(jump);
    const timeval now = fake.clock.timeOfDay();
    backend->sendMessage(Dictionary{{"a", 1}}, now, 4, 0);
    ASSERT_EQ(postCount(), ++posts);
    EXPECT_EQ(lastEvent().string("_method"), "4");
  }
}

}  // namespace
}  // namespace tallyd
