#include "storebag/StorebagCache.h"

#include <condition_variable>
#include <thread>

#include "StorebagFixture.h"

namespace tallyd {
namespace {

using namespace std::chrono_literals;
using FetchState = CachedStorebag::FetchState;

platform::TimePoint at(std::chrono::microseconds since1970) { return platform::TimePoint(since1970); }

CachedStorebag entryOf(FetchState state, std::int32_t maxAgeSeconds) {
  return {.storebag = {},
          .fetchTime = at(1000s),
          .fetchState = state,
          .maxAgeSeconds = maxAgeSeconds,
          .version = {}};
}

TEST(StorebagDecisionTest, FetchesWhenNothingIsKnown) {
  EXPECT_EQ(decideStorebag(nullptr, at(0s)), StorebagDecision::Fetch);
}

TEST(StorebagDecisionTest, UsesASuccessUntilItsMaxAgeIsReached) {
  const CachedStorebag entry = entryOf(FetchState::Successful, 600);
  EXPECT_EQ(decideStorebag(&entry, at(1000s)), StorebagDecision::UseCached);
  EXPECT_EQ(decideStorebag(&entry, at(1599'999'999us)), StorebagDecision::UseCached);
  EXPECT_EQ(decideStorebag(&entry, at(1600s)), StorebagDecision::Fetch);
}

TEST(StorebagDecisionTest, CountsTheAgeOfASuccessBackwardsToo) {
  const CachedStorebag entry = entryOf(FetchState::Successful, 600);
  EXPECT_EQ(decideStorebag(&entry, at(400'000'001us)), StorebagDecision::UseCached);
  EXPECT_EQ(decideStorebag(&entry, at(400s)), StorebagDecision::Fetch);
  EXPECT_EQ(decideStorebag(&entry, at(-1'000'000s)), StorebagDecision::Fetch);
}

TEST(StorebagDecisionTest, NeverUsesASuccessWithoutAMaxAge) {
  for (const std::int32_t maxAgeSeconds : {0, -1, std::numeric_limits<std::int32_t>::min()}) {
    const CachedStorebag entry = entryOf(FetchState::Successful, maxAgeSeconds);
    EXPECT_EQ(decideStorebag(&entry, at(1000s)), StorebagDecision::Fetch);
  }
}

TEST(StorebagDecisionTest, WaitsNineHundredSecondsAfterAFailure) {
  const CachedStorebag entry = entryOf(FetchState::Failure, 0);
  EXPECT_EQ(decideStorebag(&entry, at(1000s)), StorebagDecision::WaitAfterFailure);
  EXPECT_EQ(decideStorebag(&entry, at(1899'999ms)), StorebagDecision::WaitAfterFailure);
  EXPECT_EQ(decideStorebag(&entry, at(1900s)), StorebagDecision::Fetch);
}

TEST(StorebagDecisionTest, CountsTheAgeOfAFailureBackwardsToo) {
  const CachedStorebag entry = entryOf(FetchState::Failure, 0);
  EXPECT_EQ(decideStorebag(&entry, at(100'001ms)), StorebagDecision::WaitAfterFailure);
  EXPECT_EQ(decideStorebag(&entry, at(100s)), StorebagDecision::Fetch);
}

TEST(StorebagDecisionTest, AFailuresMaxAgeIsNeverConsulted) {
  const CachedStorebag entry = entryOf(FetchState::Failure, 86'400);
  EXPECT_EQ(decideStorebag(&entry, at(1900s)), StorebagDecision::Fetch);
}

class StorebagCacheTest : public StorebagFixture {
 protected:
  std::optional<platform::Dictionary> storebag(std::int32_t clientType = 5) {
    return cache.storebag(31, clientType);
  }
  Lines linesOfRequest(std::int32_t clientType = 5) {
    fake.log.clear();
    (void)storebag(clientType);
    return fake.log.lines();
  }

  StorebagCache cache{platform};
};

TEST_F(StorebagCacheTest, TheFirstRequestFetchesOnce) {
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 1U);
  EXPECT_EQ(cache.version(5), "bag 17");
  EXPECT_EQ(fake.log.lines(), (Lines{debug("Retrieving storebag for session 31 with client type 5"),
                                     debug("Fetching storebag for client type 5"),
                                     debug(std::string("Storebag Server URL: ") + kPlayhallURL),
                                     info("Environment type 4"), debug("Storebag max age: 600 seconds")}));
}

TEST_F(StorebagCacheTest, AFailedFirstFetchGivesNothing) {
  serveFailure("no network");
  EXPECT_EQ(storebag(), std::nullopt);
  EXPECT_EQ(cache.version(5), std::nullopt);
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{debug("Retrieving storebag for session 31 with client type 5"),
             debug("Fetching storebag for client type 5"),
             debug(std::string("Storebag Server URL: ") + kPlayhallURL),
             critical(std::string("Error resolving with lookup server ") + kPlayhallURL),
             critical("sendSynchronousRequest error no network"),
             critical("Could not fetch storebag for client type 5"), debug("Storebag max age: 0 seconds"),
             critical("Unable to fetch storebag for client type 5")}));
}

TEST_F(StorebagCacheTest, AFreshStorebagIsServedFromTheCacheWithALineEachTime) {
  (void)storebag();
  for (int i = 0; i < 3; ++i) {
    EXPECT_EQ(linesOfRequest(), (Lines{debug("Retrieving storebag for session 31 with client type 5"),
                                       debug("Cached storebag found for client type 5")}));
    EXPECT_EQ(storebag(), section("release"));
  }
  EXPECT_EQ(requestCount(), 1U);
}

TEST_F(StorebagCacheTest, AStorebagOfADayIsFetchedAgainAfterADay) {
  serve(bag(), "public");
  (void)storebag();
  fake.clock.advance(86'400s - 1us);
  (void)storebag();
  EXPECT_EQ(requestCount(), 1U);
  fake.clock.advance(1us);
  (void)storebag();
  EXPECT_EQ(requestCount(), 2U);
}

TEST_F(StorebagCacheTest, AMaxAgeOfZeroFetchesOnEveryRequest) {
  serve(bag(), std::nullopt);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 3U);
}

TEST_F(StorebagCacheTest, ARefetchReplacesStorebagAndVersion) {
  (void)storebag();
  serve({{"version", "bag 18"}, {"release", section("newer")}});
  EXPECT_EQ(storebag(), section("release"));
  fake.clock.advance(600s);
  EXPECT_EQ(storebag(), section("newer"));
  EXPECT_EQ(cache.version(5), "bag 18");
}

TEST_F(StorebagCacheTest, AFailedRefetchStillServesTheOldStorebag) {
  (void)storebag();
  fake.clock.advance(600s);
  serveFailure("no network");
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 2U);
}

TEST_F(StorebagCacheTest, AfterAFailedRefetchTheOldStorebagIsServedWithoutRequestsForNineHundredSeconds) {
  (void)storebag();
  fake.clock.advance(600s);
  serveFailure("no network");
  (void)storebag();
  const Lines waiting{
      debug("Retrieving storebag for session 31 with client type 5"),
      info("Not fetching storebag for client type 5 - must wait 900 seconds between attempts")};
  EXPECT_EQ(linesOfRequest(), waiting);
  fake.clock.advance(899'999ms);
  EXPECT_EQ(linesOfRequest(), waiting);
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 2U);

  serve(bag());
  fake.clock.advance(1ms);
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 3U);
  EXPECT_EQ(cache.version(5), "bag 17");
}

TEST_F(StorebagCacheTest, AfterAFailedFirstFetchRequestsGetNothingForNineHundredSeconds) {
  serveFailure("no network");
  (void)storebag();
  serve(bag());
  fake.clock.advance(899'999ms);
  EXPECT_EQ(storebag(), std::nullopt);
  EXPECT_EQ(requestCount(), 1U);
  fake.clock.advance(1ms);
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(requestCount(), 2U);
}

TEST_F(StorebagCacheTest, TheWaitStartsAnewWithEveryFailedAttempt) {
  serveFailure("no network");
  (void)storebag();
  fake.clock.advance(900s);
  (void)storebag();
  EXPECT_EQ(requestCount(), 2U);
  fake.clock.advance(899s);
  (void)storebag();
  EXPECT_EQ(requestCount(), 2U);
  fake.clock.advance(1s);
  (void)storebag();
  EXPECT_EQ(requestCount(), 3U);
}

TEST_F(StorebagCacheTest, AClockSetBackCountsTheSameDistance) {
  (void)storebag();
  fake.clock.advance(-599s);
  (void)storebag();
  EXPECT_EQ(requestCount(), 1U);
  fake.clock.advance(-1s);
  (void)storebag();
  EXPECT_EQ(requestCount(), 2U);
}

TEST_F(StorebagCacheTest, TheVersionIsGoneAfterAFailureThoughTheStorebagIsStillServed) {
  (void)storebag();
  fake.clock.advance(600s);
  serveFailure("no network");
  EXPECT_EQ(storebag(), section("release"));
  EXPECT_EQ(cache.version(5), std::nullopt);
  EXPECT_EQ(storebag(), section("release"));
}

TEST_F(StorebagCacheTest, AVerifiedBagWithoutASectionIsAFailure) {
  serve({{"version", "1"}});
  EXPECT_EQ(storebag(), std::nullopt);
  EXPECT_EQ(fake.log.lines().back(), critical("Unable to fetch storebag for client type 5"));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Debug, "Storebag max age: 600 seconds"));
  (void)storebag();
  EXPECT_EQ(requestCount(), 1U);
}

TEST_F(StorebagCacheTest, TheVersionIsNeverFetchedAndNeverLogged) {
  EXPECT_EQ(cache.version(5), std::nullopt);
  EXPECT_EQ(cache.version(0), std::nullopt);
  EXPECT_EQ(cache.version(3), std::nullopt);
  EXPECT_EQ(cache.version(-1), std::nullopt);
  EXPECT_EQ(cache.version(12), std::nullopt);
  EXPECT_EQ(requestCount(), 0U);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(StorebagCacheTest, EveryClientTypeHasAnEntryOfItsOwn) {
  (void)storebag(5);
  serveFailure("no network");
  EXPECT_EQ(storebag(6), std::nullopt);
  EXPECT_EQ(storebag(5), section("release"));
  EXPECT_EQ(cache.version(5), "bag 17");
  EXPECT_EQ(cache.version(6), std::nullopt);
  EXPECT_EQ(requestCount(), 2U);
}

/// Lets requests go on only once `expected` of them are under way at the same time.
class Meeting {
 public:
  explicit Meeting(int expected) : _expected(expected) {}

  bool meet() {
    std::unique_lock lock(_mutex);
    ++_present;
    _changed.notify_all();
    return _changed.wait_for(lock, 30s, [this] { return _present >= _expected; });
  }

 private:
  const int _expected;
  std::mutex _mutex;
  std::condition_variable _changed;
  int _present = 0;
};

TEST_F(StorebagCacheTest, TwoSessionsThatFetchAtOnceDoNotWaitForEachOther) {
  Meeting meeting(2);
  std::atomic<int> met = 0;
  const auto answer = fake.http.answer;
  fake.http.answer = [&, answer](const platform::HTTPRequest& request) {
    if (meeting.meet()) ++met;
    return answer(request);
  };
  std::optional<platform::Dictionary> first;
  std::optional<platform::Dictionary> second;
  std::thread one([&] { first = cache.storebag(1, 5); });
  std::thread two([&] { second = cache.storebag(2, 5); });
  one.join();
  two.join();
  EXPECT_EQ(met, 2);
  EXPECT_EQ(first, section("release"));
  EXPECT_EQ(second, section("release"));
  EXPECT_EQ(requestCount(), 2U);
}

TEST_F(StorebagCacheTest, AFetchUnderWayDelaysNoRequestThatTheCacheCanServe) {
  (void)storebag(5);
  Meeting meeting(2);
  bool met = false;
  const auto answer = fake.http.answer;
  fake.http.answer = [&, answer](const platform::HTTPRequest& request) {
    met = meeting.meet();
    return answer(request);
  };
  std::thread fetching([&] { (void)cache.storebag(1, 6); });
  EXPECT_EQ(storebag(5), section("release"));
  meeting.meet();
  fetching.join();
  EXPECT_TRUE(met);
}

TEST_F(StorebagCacheTest, ManySessionsMayAskAtOnce) {
  serve(bag(), "max-age=0");
  std::vector<std::thread> sessions;
  std::atomic<int> served = 0;
  for (std::uint32_t session = 0; session < 8; ++session) {
    sessions.emplace_back([&, session] {
      const auto clientType = static_cast<std::int32_t>(5 + session % 3);
      for (int i = 0; i < 10; ++i) {
        if (cache.storebag(session, clientType) == section("release")) ++served;
        (void)cache.version(clientType);
      }
    });
  }
  for (std::thread& session : sessions) session.join();
  EXPECT_EQ(served, 80);
  EXPECT_EQ(requestCount(), 80U);
}

}  // namespace
}  // namespace tallyd
