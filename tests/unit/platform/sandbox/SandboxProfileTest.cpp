#include "platform/sandbox/SandboxProfile.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/sandbox/SandboxErrors.h"

namespace tallyd::platform {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const Root kRoot("/some/root");

std::string plist(std::string_view entries) {
  return R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)" + std::string(entries) +
         "</dict></plist>";
}

constexpr std::string_view kCalls =
    "<key>SystemCalls</key><array><string>@files</string><string>read</string></array>";

std::string errorOf(std::string_view bytes) {
  try {
    static_cast<void>(sandboxProfileWithData(bytes, kRoot));
  } catch (const ProfileError& error) {
    return error.what();
  }
  return "none";
}

std::string errorWith(std::string_view entries) {
  return errorOf(plist(std::string(entries) + std::string(kCalls)));
}

TEST(SandboxProfileTest, ReadsAllKeys) {
  const auto profile =
      sandboxProfileWithData(plist("<key>Read</key><array><string>etc/tally</string><string>/run</"
                                   "string><string>system:/etc</string></array>"
                                   "<key>Write</key><array><string>var</string></array>"
                                   "<key>Remove</key><array><string>system:/tmp</string></array>"
                                   "<key>Optional</key><true/>" +
                                   std::string(kCalls)),
                             kRoot);
  EXPECT_THAT(profile.read, ElementsAre("/some/root/etc/tally", "/some/root/run", "/etc"));
  EXPECT_THAT(profile.write, ElementsAre("/some/root/var"));
  EXPECT_THAT(profile.remove, ElementsAre("/tmp"));
  EXPECT_THAT(profile.systemCalls, ElementsAre("@files", "read"));
  EXPECT_TRUE(profile.optional);
}

TEST(SandboxProfileTest, IsNotOptionalAndOpensNoFoldersUnlessItSaysSo) {
  const auto profile = sandboxProfileWithData(plist(kCalls), kRoot);
  EXPECT_THAT(profile.read, IsEmpty());
  EXPECT_THAT(profile.write, IsEmpty());
  EXPECT_THAT(profile.remove, IsEmpty());
  EXPECT_FALSE(profile.optional);
}

TEST(SandboxProfileTest, RefusesWhatIsNoDictionary) {
  EXPECT_THAT(errorOf("nonsense <"),
              testing::AnyOf(HasSubstr("no property list"), HasSubstr("not a dictionary")));
  EXPECT_THAT(errorOf(""), HasSubstr("no property list"));
  EXPECT_THAT(errorOf("<plist version=\"1.0\"><array/></plist>"), HasSubstr("not a dictionary"));
}

TEST(SandboxProfileTest, RefusesKeysThatItDoesNotKnow) {
  EXPECT_THAT(errorWith("<key>Reads</key><array/>"), HasSubstr("\"Reads\""));
}

TEST(SandboxProfileTest, RefusesValuesOfTheWrongKind) {
  EXPECT_THAT(errorWith("<key>Read</key><string>etc</string>"), HasSubstr("\"Read\" is not an array"));
  EXPECT_THAT(errorWith("<key>Write</key><array><integer>1</integer></array>"), HasSubstr("\"Write\""));
  EXPECT_THAT(errorWith("<key>Remove</key><array><string></string></array>"), HasSubstr("\"Remove\""));
}

TEST(SandboxProfileTest, RefusesPathsThatLeadElsewhere) {
  EXPECT_THAT(errorWith("<key>Read</key><array><string>etc/../..</string></array>"),
              HasSubstr("leads upwards"));
  EXPECT_THAT(errorWith("<key>Read</key><array><string>system:etc</string></array>"),
              HasSubstr("not absolute"));
}

TEST(SandboxProfileTest, RefusesAProfileThatAllowsNoSystemCalls) {
  EXPECT_THAT(errorOf(plist("")), HasSubstr("\"SystemCalls\""));
  EXPECT_THAT(errorOf(plist("<key>SystemCalls</key><array/>")), HasSubstr("\"SystemCalls\""));
}

}  // namespace
}  // namespace tallyd::platform
