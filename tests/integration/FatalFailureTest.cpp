// The failures that end the daemon, each with its line.

#include <gtest/gtest.h>

#include <csignal>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;

class FatalFailureTest : public testing::Test {
 protected:
  /// Starts a session of this client type and waits for the daemon's end.
  ExitStatus endAfterStart(TestDaemon& daemon, std::optional<std::int32_t> clientType) {
    auto connection = daemon.connect();
    if (clientType) connection->setSessionInfoSync(sessionInfo(1, *clientType), std::nullopt);
    EXPECT_TRUE(connection->startConfigSync().error);
    return daemon.process().wait();
  }

  StorebagServer storebags;
  TestRoot root{storebags};
};

TEST_F(FatalFailureTest, EndsOnAStartBeforeAnyConfiguration) {
  TestDaemon daemon(root);
  EXPECT_EQ(endAfterStart(daemon, std::nullopt).signal, SIGABRT);
  EXPECT_EQ(daemon.process().countOnce("<2>Could not find storebag name for client type 0", 1), 1U);
  EXPECT_EQ(daemon.process().lines().back(),
            "<2>Client type 0 has no storebag name to keep its storebag under");
  EXPECT_EQ(storebags.http().requests().size(), 0U);
}

TEST_F(FatalFailureTest, EndsOnAClientTypeWithoutAStorebagNameAfterItsRequest) {
  TestDaemon daemon(root);
  EXPECT_EQ(endAfterStart(daemon, 3).signal, SIGABRT);
  EXPECT_EQ(daemon.process().lines().back(),
            "<2>Client type 3 has no storebag name to keep its storebag under");
  ASSERT_EQ(storebags.http().requests().size(), 1U);
  EXPECT_TRUE(storebags.http().requests()[0].target.ends_with("/(null)?version=7.0"))
      << storebags.http().requests()[0].target;
}

TEST_F(FatalFailureTest, EndsOnABagWithoutAVersion) {
  storebags.serveBag("playhall", Dictionary{{"release", storebagWithHTTPSPost()}}, "max-age=600");
  TestDaemon daemon(root);
  EXPECT_EQ(endAfterStart(daemon, 5).signal, SIGABRT);
  EXPECT_EQ(daemon.process().lines().back(), "<2>Storebag for client type 5 has no version");
}

TEST_F(FatalFailureTest, EndsOnACacheControlThatEndsInMaxAge) {
  storebags.serve("playhall", storebagWithHTTPSPost(), "no-cache, max-age");
  TestDaemon daemon(root);
  EXPECT_EQ(endAfterStart(daemon, 5).signal, SIGABRT);
  EXPECT_EQ(daemon.process().lines().back(),
            "<2>Cache-Control \"no-cache, max-age\" of the storebag server ends in max-age without a number");
}

}  // namespace
}  // namespace tallyd::test
