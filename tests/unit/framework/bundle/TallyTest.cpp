#include "framework/Tally.h"

#include <gtest/gtest.h>

#include "fakes/FakePlatform.h"

namespace tallyd {
namespace {

class TallyTest : public testing::Test {
 protected:
  fakes::FakePlatform fake;
  Tally tally{fake.platform};
};

TEST_F(TallyTest, TheVersionIsTheBundles) {
  EXPECT_EQ(tally.bundleVersion(), "7.42.1");
  fake.frameworkBundle.info.set("CFBundleVersion", "8");
  EXPECT_EQ(tally.bundleVersion(), "8");
}

TEST_F(TallyTest, ABundleWithoutVersionHasNone) {
  fake.frameworkBundle.info.remove("CFBundleVersion");
  EXPECT_EQ(tally.bundleVersion(), std::nullopt);
}

TEST_F(TallyTest, AVersionThatIsNoTextIsNone) {
  fake.frameworkBundle.info.set("CFBundleVersion", 7);
  EXPECT_EQ(tally.bundleVersion(), std::nullopt);
}

TEST_F(TallyTest, TheDefaultVersionIsFixed) { EXPECT_EQ(kDefaultReportingVersion, "6.21"); }

TEST_F(TallyTest, TheClientIdentifierIsTheTextOfAUUID) {
  for (const bool consented : {false, true}) {
    const auto identifier = tally.getPersistentIdentifierForDNU(consented);
    ASSERT_TRUE(identifier);
    std::string shape = *identifier;
    for (char& letter : shape) {
      if (std::string_view("0123456789ABCDEF").find(letter) != std::string_view::npos) letter = 'x';
    }
    EXPECT_EQ(shape, "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx") << *identifier;
  }
}

TEST_F(TallyTest, TheClientIdentifierIsTheSameAtEachCall) {
  for (const bool consented : {false, true}) {
    EXPECT_EQ(tally.getPersistentIdentifierForDNU(consented),
              Tally(fake.platform).getPersistentIdentifierForDNU(consented));
  }
}

TEST_F(TallyTest, EachConsentHasAnIdentifierOfItsOwn) {
  EXPECT_NE(tally.getPersistentIdentifierForDNU(true), tally.getPersistentIdentifierForDNU(false));
}

TEST_F(TallyTest, ADeviceWithoutMachineIDHasNoClientIdentifier) {
  fake.device.hasMachineID = false;
  EXPECT_EQ(tally.getPersistentIdentifierForDNU(true), std::nullopt);
  EXPECT_EQ(tally.getPersistentIdentifierForDNU(false), std::nullopt);
}

}  // namespace
}  // namespace tallyd
