#include "platform/dbus/Signature.h"

#include <gtest/gtest.h>

#include <string>

namespace tallyd::platform::dbus {
namespace {

std::string repeated(std::string_view part, int times) {
  std::string text;
  for (int i = 0; i < times; ++i) text += part;
  return text;
}

TEST(SignatureTest, FindsTheFirstCompleteType) {
  EXPECT_EQ(completeTypeLength(""), 0U);
  EXPECT_EQ(completeTypeLength("qaa{sv}"), 1U);
  EXPECT_EQ(completeTypeLength("aa{sv}as"), 6U);
  EXPECT_EQ(completeTypeLength("(d(ss))u"), 7U);
  EXPECT_EQ(completeTypeLength("a(d)u"), 4U);
}

TEST(SignatureTest, TakesEveryTypeAndSequence) {
  for (const char* signature :
       {"", "ybnqiuxtdsogvh", "aay", "a{sv}", "a{ya{sv}}", "(d)", "(s(iu)av)", "aa{sv}as"})
    EXPECT_TRUE(isValidSignature(signature)) << signature;
}

TEST(SignatureTest, RefusesWhatIsNoSignature) {
  for (const char* signature : {"a", "z", "(", "()", "(d", "d)", "{sv}", "a{}", "a{s}", "a{svv}", "a{vs}",
                                "a{(s)v}", "a{sv", "aa", "e", "r"})
    EXPECT_FALSE(isValidSignature(signature)) << signature;
}

TEST(SignatureTest, BoundsLengthAndDepth) {
  EXPECT_TRUE(isValidSignature(repeated("s", 255)));
  EXPECT_FALSE(isValidSignature(repeated("s", 256)));
  EXPECT_TRUE(isValidSignature(repeated("a", 32) + "s"));
  EXPECT_FALSE(isValidSignature(repeated("a", 33) + "s"));
  EXPECT_TRUE(isValidSignature(repeated("(", 32) + "s" + repeated(")", 32)));
  EXPECT_FALSE(isValidSignature(repeated("(", 33) + "s" + repeated(")", 33)));
}

TEST(SignatureTest, KnowsOneCompleteTypeFromSeveral) {
  EXPECT_TRUE(isOneCompleteType("s"));
  EXPECT_TRUE(isOneCompleteType("v"));
  EXPECT_TRUE(isOneCompleteType("a{sv}"));
  EXPECT_FALSE(isOneCompleteType(""));
  EXPECT_FALSE(isOneCompleteType("a"));
  EXPECT_FALSE(isOneCompleteType("ss"));
  EXPECT_FALSE(isOneCompleteType("z"));
}

}  // namespace
}  // namespace tallyd::platform::dbus
