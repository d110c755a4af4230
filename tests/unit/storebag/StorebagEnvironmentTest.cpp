#include "storebag/StorebagEnvironment.h"

#include <limits>
#include <thread>

#include "StorebagFixture.h"

namespace tallyd {
namespace {

class StorebagEnvironmentTest : public StorebagFixture {};

TEST_F(StorebagEnvironmentTest, ClientTypesFiveToElevenHaveStorebagNames) {
  EXPECT_EQ(storebagNameForClientType(5), "playhall");
  EXPECT_EQ(storebagNameForClientType(6), "vitrine");
  EXPECT_EQ(storebagNameForClientType(7), "dialhouse");
  EXPECT_EQ(storebagNameForClientType(8), "lanternbox");
  EXPECT_EQ(storebagNameForClientType(9), "broadwave");
  EXPECT_EQ(storebagNameForClientType(10), "hintery");
  EXPECT_EQ(storebagNameForClientType(11), "fennel");
}

TEST_F(StorebagEnvironmentTest, NoOtherClientTypeHasAStorebagName) {
  for (const std::int32_t clientType :
       {0, 1, 2, 3, 4, 12, 13, -1, -5, std::numeric_limits<std::int32_t>::min(),
        std::numeric_limits<std::int32_t>::max()}) {
    EXPECT_EQ(storebagNameForClientType(clientType), std::nullopt) << clientType;
  }
}

TEST_F(StorebagEnvironmentTest, EnvironmentTypesOneToFourHaveSectionNames) {
  EXPECT_EQ(environmentNameForType(0), std::nullopt);
  EXPECT_EQ(environmentNameForType(1), "development");
  EXPECT_EQ(environmentNameForType(2), "quillon_internal");
  EXPECT_EQ(environmentNameForType(3), "seed");
  EXPECT_EQ(environmentNameForType(4), "release");
  EXPECT_EQ(environmentNameForType(5), std::nullopt);
  EXPECT_EQ(environmentNameForType(std::numeric_limits<std::uint32_t>::max()), std::nullopt);
}

TEST_F(StorebagEnvironmentTest, WithoutAPreferenceACustomerBuildIsRelease) {
  EXPECT_EQ(currentEnvironmentType(platform), 4U);
  EXPECT_EQ(fake.log.lines(), Lines{info("Environment type 4")});
}

TEST_F(StorebagEnvironmentTest, WithoutAPreferenceAnInternalBuildIsInternal) {
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_EQ(currentEnvironmentType(platform), 2U);
  EXPECT_EQ(fake.log.lines(), Lines{info("Environment type 2")});
}

TEST_F(StorebagEnvironmentTest, AReleaseTypeOtherThanInternalIsACustomerBuild) {
  fake.device.answers["ReleaseType"] = "internal";
  EXPECT_EQ(currentEnvironmentType(platform), 4U);
}

TEST_F(StorebagEnvironmentTest, PreferencesZeroToFourAreTakenAsTheyAre) {
  for (const std::int64_t type : {0, 1, 2, 3, 4}) {
    fakes::FakePlatform device;
    device.preferences.set("com.quillon.tally", "environmentType", type);
    EXPECT_EQ(currentEnvironmentType(device.platform), static_cast<std::uint32_t>(type));
    EXPECT_EQ(device.log.lines(), Lines{info("Environment type " + std::to_string(type))});
  }
}

TEST_F(StorebagEnvironmentTest, TheLowThirtyTwoBitsOfThePreferenceCount) {
  prefer("environmentType", std::int64_t{(std::int64_t{1} << 32) + 3});
  EXPECT_EQ(currentEnvironmentType(platform), 3U);
  EXPECT_EQ(fake.log.lines(), Lines{info("Environment type 3")});
}

TEST_F(StorebagEnvironmentTest, APreferenceOfFiveOrMoreIsRefusedForInternal) {
  const std::pair<std::int64_t, const char*> table[] = {
      {5, "5"},
      {7, "7"},
      {0xFFFF'FFFF, "4294967295"},
      {-1, "4294967295"},
      {-4'294'967'295 + 8, "9"},
      {std::numeric_limits<std::int64_t>::max(), "4294967295"}};
  for (const auto& [preference, shown] : table) {
    fakes::FakePlatform device;
    device.preferences.set("com.quillon.tally", "environmentType", preference);
    EXPECT_EQ(currentEnvironmentType(device.platform), 2U) << preference;
    EXPECT_EQ(device.log.lines(), (Lines{critical(std::string("Invalid environment type ") + shown),
                                         info("Environment type 2")}));
  }
}

TEST_F(StorebagEnvironmentTest, APreferenceThatIsTextIsReadAsItsNumber) {
  prefer("environmentType", " 3rd");
  EXPECT_EQ(currentEnvironmentType(platform), 3U);
}

TEST_F(StorebagEnvironmentTest, APreferenceThatIsWordsIsTypeZero) {
  prefer("environmentType", "release");
  EXPECT_EQ(currentEnvironmentType(platform), 0U);
  EXPECT_EQ(fake.log.lines(), Lines{info("Environment type 0")});
}

TEST_F(StorebagEnvironmentTest, TheEnvironmentTypeIsDecidedOnceForTheLifeOfTheProcess) {
  prefer("environmentType", 1);
  EXPECT_EQ(currentEnvironmentType(platform), 1U);
  prefer("environmentType", 3);
  EXPECT_EQ(currentEnvironmentType(platform), 1U);
  EXPECT_EQ(fake.log.lines().size(), 1U);
}

TEST_F(StorebagEnvironmentTest, ConcurrentFirstCallsDecideOnce) {
  prefer("environmentType", 7);
  std::vector<std::thread> threads;
  std::vector<std::uint32_t> types(8);
  for (std::uint32_t& type : types) threads.emplace_back([&] { type = currentEnvironmentType(platform); });
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(types, std::vector<std::uint32_t>(8, 2));
  EXPECT_EQ(fake.log.lines().size(), 2U);
}

TEST_F(StorebagEnvironmentTest, TheServerIsThePublicOneOnACustomerBuild) {
  EXPECT_EQ(storebagBaseURL(platform), "https://storebags.quillon.example/bags/sorrel");
}

TEST_F(StorebagEnvironmentTest, TheServerIsTheInternalOneOnAnInternalBuild) {
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_EQ(storebagBaseURL(platform), "https://storebags.quillon.internal/storebags/sorrel");
}

TEST_F(StorebagEnvironmentTest, APreferredServerWinsAndIsReadOnceForTheLifeOfTheProcess) {
  prefer("tally_storebag_url", "http://bags.test:81/x");
  EXPECT_EQ(storebagBaseURL(platform), "http://bags.test:81/x");
  prefer("tally_storebag_url", "http://elsewhere.test");
  EXPECT_EQ(storebagBaseURL(platform), "http://bags.test:81/x");
  fake.preferences.values.clear();
  EXPECT_EQ(storebagBaseURL(platform), "http://bags.test:81/x");
}

TEST_F(StorebagEnvironmentTest, AServerPreferredAfterTheFirstCallHasNoEffect) {
  EXPECT_EQ(storebagBaseURL(platform), "https://storebags.quillon.example/bags/sorrel");
  prefer("tally_storebag_url", "http://late.test");
  EXPECT_EQ(storebagBaseURL(platform), "https://storebags.quillon.example/bags/sorrel");
}

TEST_F(StorebagEnvironmentTest, APreferredServerThatIsNoTextIsPassedOver) {
  prefer("tally_storebag_url", 5);
  EXPECT_EQ(storebagBaseURL(platform), "https://storebags.quillon.example/bags/sorrel");
}

TEST_F(StorebagEnvironmentTest, ThePostURLIsReadAfreshAtEveryCall) {
  EXPECT_EQ(httpsPostURLFromPreferences(platform), std::nullopt);
  prefer("httpsPostURL", "https://post.test/1");
  EXPECT_EQ(httpsPostURLFromPreferences(platform), "https://post.test/1");
  prefer("httpsPostURL", "https://post.test/2");
  EXPECT_EQ(httpsPostURLFromPreferences(platform), "https://post.test/2");
  prefer("httpsPostURL", true);
  EXPECT_EQ(httpsPostURLFromPreferences(platform), std::nullopt);
  fake.preferences.values.clear();
  EXPECT_EQ(httpsPostURLFromPreferences(platform), std::nullopt);
}

TEST_F(StorebagEnvironmentTest, PreferencesOfOtherSuitesDoNotCount) {
  fake.preferences.set("com.quillon.diagnostics", "environmentType", 1);
  fake.preferences.set("com.quillon.diagnostics", "httpsPostURL", "https://post.test");
  EXPECT_EQ(currentEnvironmentType(platform), 4U);
  EXPECT_EQ(httpsPostURLFromPreferences(platform), std::nullopt);
}

}  // namespace
}  // namespace tallyd
