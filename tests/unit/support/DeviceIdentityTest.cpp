#include "support/DeviceIdentity.h"

#include <gtest/gtest.h>

#include <thread>

#include "fakes/FakePlatform.h"
#include "support/Consent.h"

namespace tallyd {
namespace {

using fakes::FakePlatform;

TEST(DeviceIdentityTest, AsksThePlatformForEachFactUnderItsKey) {
  FakePlatform fake;
  EXPECT_EQ(deviceProductVersion(fake.platform), "12.4");
  EXPECT_EQ(deviceBuildVersion(fake.platform), "12D500");
  EXPECT_EQ(deviceProductType(fake.platform), "Kasten3,1");
  EXPECT_EQ(deviceName(fake.platform), "Kasten");
  EXPECT_EQ(deviceHardwareModel(fake.platform), "K31AP");
  EXPECT_EQ(deviceSerialNumber(fake.platform), "QX1234");
}

TEST(DeviceIdentityTest, GivesNothingOnADeviceWithoutAnswers) {
  FakePlatform fake;
  fake.device.answers.clear();
  EXPECT_EQ(deviceProductVersion(fake.platform), std::nullopt);
  EXPECT_EQ(deviceSerialNumber(fake.platform), std::nullopt);
}

TEST(DeviceIdentityTest, AsksAnewEachTime) {
  FakePlatform fake;
  EXPECT_EQ(deviceName(fake.platform), "Kasten");
  fake.device.answers["DeviceName"] = "Truhe";
  EXPECT_EQ(deviceName(fake.platform), "Truhe");
  EXPECT_EQ(fake.device.questionsAsked, 2U);
}

TEST(DeviceIdentityTest, FillsTheBufferWithAnIDOfFortyCharactersAndATerminator) {
  FakePlatform fake;
  DeviceIDBuffer buffer;
  buffer.fill('x');
  copyUniqueDeviceID(fake.platform, buffer);
  EXPECT_STREQ(buffer.data(), "0123456789abcdef0123456789abcdef01234567");
  EXPECT_EQ(buffer[40], '\0');
}

TEST(DeviceIdentityTest, TerminatesAShorterIDAndTheBuffersEnd) {
  FakePlatform fake;
  fake.device.answers["UniqueDeviceID"] = "abc";
  DeviceIDBuffer buffer;
  buffer.fill('x');
  copyUniqueDeviceID(fake.platform, buffer);
  EXPECT_STREQ(buffer.data(), "abc");
  EXPECT_EQ(buffer[40], '\0');
}

TEST(DeviceIdentityTest, LeavesTheBufferAsItIsWithoutAnID) {
  FakePlatform fake;
  fake.device.answers.erase("UniqueDeviceID");
  DeviceIDBuffer zeroed{};
  copyUniqueDeviceID(fake.platform, zeroed);
  EXPECT_EQ(zeroed, DeviceIDBuffer{});
}

TEST(DeviceIdentityTest, LeavesTheBufferAsItIsWhenTheIDDoesNotFit) {
  FakePlatform fake;
  fake.device.answers["UniqueDeviceID"] = std::string(41, 'a');
  DeviceIDBuffer zeroed{};
  copyUniqueDeviceID(fake.platform, zeroed);
  EXPECT_EQ(zeroed, DeviceIDBuffer{});
}

TEST(DeviceIdentityTest, TakesOnlyTheReleaseTypeInternalForAnInternalBuild) {
  for (const auto& [releaseType, expected] : std::map<std::string, bool>{
           {"Internal", true}, {"internal", false}, {"Beta", false}, {"", false}, {"Internal ", false}}) {
    FakePlatform fake;
    fake.device.answers["ReleaseType"] = releaseType;
    EXPECT_EQ(isInternalBuild(fake.platform), expected) << releaseType;
  }
  FakePlatform without;
  EXPECT_FALSE(isInternalBuild(without.platform));
}

TEST(DeviceIdentityTest, KeepsTheInternalFlagForTheLifeOfTheProcess) {
  FakePlatform fake;
  EXPECT_FALSE(isInternalBuild(fake.platform));
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_FALSE(isInternalBuild(fake.platform));
  EXPECT_EQ(fake.device.questionsAsked, 1U);
}

TEST(DeviceIdentityTest, KeepsOneInstanceUUIDForTheLifeOfTheProcess) {
  FakePlatform fake;
  const std::string first = processInstanceUUIDString(fake.platform);
  EXPECT_EQ(first, "00000000-0000-4000-8000-000000000001");
  EXPECT_EQ(processInstanceUUIDString(fake.platform), first);
}

TEST(DeviceIdentityTest, GivesConcurrentFirstCallersOneUUID) {
  FakePlatform fake;
  std::vector<std::string> seen(8);
  {
    std::vector<std::jthread> threads;
    for (auto& uuid : seen) {
      threads.emplace_back([&fake, &uuid] { uuid = processInstanceUUIDString(fake.platform); });
    }
  }
  for (const auto& uuid : seen) EXPECT_EQ(uuid, seen[0]);
}

TEST(ConsentTest, MeansNoWithoutAnAnswer) {
  FakePlatform fake;
  EXPECT_FALSE(DiagnosticLogSubmissionEnabled(fake.platform));
}

TEST(ConsentTest, FollowsThePreference) {
  FakePlatform fake;
  fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", true);
  EXPECT_TRUE(DiagnosticLogSubmissionEnabled(fake.platform));
  fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", false);
  EXPECT_FALSE(DiagnosticLogSubmissionEnabled(fake.platform));
}

}  // namespace
}  // namespace tallyd
