// Where the process is to go on, the failures that would end it cost the one request.

#include "StorebagFixture.h"
#include "storebag/StorebagCache.h"

namespace tallyd {
namespace {

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::FatalFailures;

class ResilientStorebagTest : public StorebagFixture {
 protected:
  std::optional<Dictionary> ask(std::int32_t clientType = 5) { return cache.storebag(31, clientType); }
  void serveWithoutVersion() { serve(Dictionary{{"release", section("release")}}); }

  StorebagCache cache{platform, FatalFailures::FailRequest};
};

TEST_F(ResilientStorebagTest, ABagWithoutVersionFailsLikeAFetchThatFailed) {
  serveWithoutVersion();
  EXPECT_EQ(ask(), std::nullopt);
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{debug("Retrieving storebag for session 31 with client type 5"),
             debug("Fetching storebag for client type 5"),
             debug(std::string("Storebag Server URL: ") + kPlayhallURL), info("Environment type 4"),
             critical("Storebag for client type 5 has no version"), debug("Storebag max age: 600 seconds"),
             critical("Unable to fetch storebag for client type 5")}));
  EXPECT_EQ(cache.version(5), std::nullopt);
}

TEST_F(ResilientStorebagTest, ACacheControlThatEndsInMaxAgeFailsLikeAFetchThatFailed) {
  serve(bag(), "no-cache, max-age");
  EXPECT_EQ(ask(), std::nullopt);
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{
          debug("Retrieving storebag for session 31 with client type 5"),
          debug("Fetching storebag for client type 5"),
          debug(std::string("Storebag Server URL: ") + kPlayhallURL),
          critical(
              "Cache-Control \"no-cache, max-age\" of the storebag server ends in max-age without a number"),
          critical("Could not fetch storebag for client type 5"), debug("Storebag max age: 0 seconds"),
          critical("Unable to fetch storebag for client type 5")}));
}

TEST_F(ResilientStorebagTest, TheStorebagThatIsThereStaysInUse) {
  EXPECT_EQ(ask(), section("release"));
  fake.clock.advance(600s);
  serveWithoutVersion();
  EXPECT_EQ(ask(), section("release"));
  fake.clock.advance(900s);
  serve(bag(), "max-age");
  EXPECT_EQ(ask(), section("release"));
  EXPECT_EQ(requestCount(), 3U);
}

TEST_F(ResilientStorebagTest, AfterSuchAFailureTheServerIsLeftAloneForAWhile) {
  for (const auto& fail : {std::function<void()>([this] { serveWithoutVersion(); }),
                           std::function<void()>([this] { serve(bag(), "max-age"); })}) {
    fail();
    (void)ask();
    const std::size_t before = requestCount();
    fake.clock.advance(899s);
    (void)ask();
    EXPECT_EQ(requestCount(), before);
    fake.clock.advance(1s);
    (void)ask();
    EXPECT_EQ(requestCount(), before + 1);
    fake.clock.advance(900s);
  }
}

TEST_F(ResilientStorebagTest, AClientTypeWithoutAStorebagNameHasNoStorebagAndTheServerIsNotAsked) {
  for (const std::int32_t clientType : {0, 1, 4, -1, 12}) {
    fake.log.clear();
    EXPECT_EQ(ask(clientType), std::nullopt);
    const std::string type = std::to_string(clientType);
    EXPECT_EQ(fake.log.lines(),
              (Lines{debug("Retrieving storebag for session 31 with client type " + type),
                     debug("Fetching storebag for client type " + type), debug("Storebag max age: 0 seconds"),
                     critical("Client type " + type + " has no storebag name to keep its storebag under"),
                     critical("Unable to fetch storebag for client type " + type)}));
  }
  EXPECT_EQ(requestCount(), 0U);
}

TEST_F(ResilientStorebagTest, OtherClientTypesAreNotDisturbed) {
  (void)ask(3);
  serve(bag(), "max-age");
  (void)ask(6);
  serve(bag());
  EXPECT_EQ(ask(5), section("release"));
  EXPECT_EQ(cache.version(5), "bag 17");
  EXPECT_EQ(cache.version(6), std::nullopt);
}

}  // namespace
}  // namespace tallyd
