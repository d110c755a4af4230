// The failures that end the process.

#include <csignal>

#include "StorebagFixture.h"
#include "fakes/LoudLog.h"
#include "storebag/StorebagCache.h"

namespace tallyd {
namespace {

using platform::Dictionary;
using testing::KilledBySignal;

class StorebagDeathTest : public StorebagFixture {
 protected:
  void fetch(std::int32_t clientType) { (void)fetchStorebagForClientType(loudPlatform, clientType); }
  void ask(std::int32_t clientType) { (void)cache.storebag(31, clientType); }

  fakes::LoudLog loudLog;
  platform::Platform loudPlatform{
      fake.root,     loudLog,          fake.clock,    fake.randomness, fake.locale,          fake.queues,
      fake.http,     fake.preferences, fake.defaults, fake.device,     fake.frameworkBundle, fake.sandbox,
      fake.powerLog, fake.codeBundles, fake.process};
  StorebagCache cache{loudPlatform};
};

TEST_F(StorebagDeathTest, ABagWithoutVersionEndsTheProcess) {
  serve(Dictionary{{"release", section("release")}});
  EXPECT_EXIT(fetch(5), KilledBySignal(SIGABRT), "\n<2>Storebag for client type 5 has no version\n$");
}

TEST_F(StorebagDeathTest, ACacheControlThatEndsInMaxAgeEndsTheProcess) {
  for (const char* header : {"max-age", "no-cache, max-age"}) {
    serve(bag(), header);
    EXPECT_EXIT(fetch(5), KilledBySignal(SIGABRT),
                "\n<2>Cache-Control \"" + std::string(header) +
                    "\" of the storebag server ends in max-age without a number\n$");
  }
}

TEST_F(StorebagDeathTest, ACacheControlThatEndsInMaxAgeEndsTheProcessBeforeTheBodyIsLookedAt) {
  serveBody("<html>", "max-age");
  EXPECT_EXIT(fetch(5), KilledBySignal(SIGABRT),
              "\n<2>propertyListWithData error [^\n]*\n<2>Cache-Control \"max-age\" of the storebag server "
              "ends in max-age without a number\n$");
}

TEST_F(StorebagDeathTest, ClientTypeZeroHasNoPlaceInTheCache) {
  EXPECT_EXIT(ask(0), KilledBySignal(SIGABRT),
              "^<7>Retrieving storebag for session 31 with client type 0\n"
              "<7>Fetching storebag for client type 0\n"
              "<2>Could not find storebag name for client type 0\n"
              "<7>Storebag max age: 0 seconds\n"
              "<2>Client type 0 has no storebag name to keep its storebag under\n$");
}

TEST_F(StorebagDeathTest, ClientTypesWithoutAStorebagNameHaveNoPlaceInTheCacheEvenAfterASuccessfulFetch) {
  for (const std::int32_t clientType : {1, 2, 3, 4, -1, 12}) {
    const std::string type = std::to_string(clientType);
    EXPECT_EXIT(ask(clientType), KilledBySignal(SIGABRT),
                "^<7>Retrieving storebag for session 31 with client type " + type +
                    "\n<7>Fetching storebag for client type " + type +
                    "\n<7>Storebag Server URL: [^\n]*/\\(null\\)\\?version=7.42.1\n<6>Environment type 4\n"
                    "<7>Storebag max age: 600 seconds\n<2>Client type " +
                    type + " has no storebag name to keep its storebag under\n$");
  }
}

TEST_F(StorebagDeathTest, ClientTypesWithoutAStorebagNameHaveNoPlaceInTheCacheAfterAFailedFetchEither) {
  serveFailure("no network");
  EXPECT_EXIT(ask(3), KilledBySignal(SIGABRT),
              "<2>Could not fetch storebag for client type 3\n<7>Storebag max age: 0 seconds\n"
              "<2>Client type 3 has no storebag name to keep its storebag under\n$");
}

}  // namespace
}  // namespace tallyd
