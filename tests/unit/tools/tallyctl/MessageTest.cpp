#include "tallyctl/Message.h"

#include <gtest/gtest.h>

namespace tallyd::tallyctl {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

Value valueIn(std::string_view assignment) {
  const auto parsed = parseAssignment(assignment);
  EXPECT_EQ(parsed.error, "");
  return parsed.value ? parsed.value->value : Value("did not parse");
}

TEST(MessageTest, ReadsCategoryTypeAndPayloadOfAnObject) {
  const auto parsed =
      messageFromJSON(R"({"category": 300, "type": 65535, "payload": {"a": 1, "b": [true, "x"]}})");
  ASSERT_TRUE(parsed.value) << parsed.error;
  EXPECT_EQ(*parsed.value, (Message{300, 65535, Dictionary{{"a", 1}, {"b", Array{true, "x"}}}}));
}

TEST(MessageTest, HasNoPayloadWhereItIsMissingOrNull) {
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":0})").value, (Message{1, 0, std::nullopt}));
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":0,"payload":null})").value,
            (Message{1, 0, std::nullopt}));
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":0,"payload":{}})").value, (Message{1, 0, Dictionary()}));
}

TEST(MessageTest, SaysWhatIsWrongWithAnObject) {
  EXPECT_EQ(messageFromJSON(R"({"type":0})").error, "\"category\" is missing");
  EXPECT_EQ(messageFromJSON(R"({"category":1})").error, "\"type\" is missing");
  EXPECT_EQ(messageFromJSON(R"({"category":65536,"type":0})").error,
            "\"category\" is not an integer from 0 to 65535");
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":-1})").error,
            "\"type\" is not an integer from 0 to 65535");
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":1.0})").error,
            "\"type\" is not an integer from 0 to 65535");
  EXPECT_EQ(messageFromJSON(R"({"category":18446744073709551615,"type":1})").error,
            "\"category\" is not an integer from 0 to 65535");
  EXPECT_EQ(messageFromJSON(R"({"category":true,"type":1})").error,
            "\"category\" is not an integer from 0 to 65535");
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":1,"payload":[1]})").error,
            "\"payload\" is not an object");
  EXPECT_EQ(messageFromJSON(R"({"category":1,"type":1,"paylaod":{}})").error, "unknown key \"paylaod\"");
  EXPECT_EQ(messageFromJSON("[1]").error, "not an object with \"category\", \"type\" and \"payload\"");
}

TEST(MessageTest, PointsAtTheByteThatIsNoJSON) {
  EXPECT_NE(messageFromJSON(R"({"category":1,})").error.find("byte 14"), std::string::npos);
  EXPECT_FALSE(messageFromJSON("").value);
}

TEST(MessageTest, RefusesAnObjectWithARepeatedKey) {
  EXPECT_EQ(messageFromJSON(R"({"type":0,"category":1,"type":0})").error, "the key \"type\" comes twice");
  EXPECT_EQ(parseAssignment(R"(k:=[{"b":{"a":1,"a":1}}])").error,
            "the value of \"k\" is no usable JSON: the key \"a\" comes twice");
}

TEST(MessageTest, GivesPlainValuesTheKindThatTheyLookLike) {
  EXPECT_EQ(valueIn("k=true"), Value(true));
  EXPECT_EQ(valueIn("k=false"), Value(false));
  EXPECT_EQ(valueIn("k=0"), Value(0));
  EXPECT_EQ(valueIn("k=-12"), Value(-12));
  EXPECT_EQ(valueIn("k=18446744073709551615"), Value(std::uint64_t{18446744073709551615U}));
  EXPECT_EQ(valueIn("k=12.5"), Value(12.5));
  EXPECT_EQ(valueIn("k=-1e3"), Value(-1000.0));
}

TEST(MessageTest, TakesEveryOtherPlainValueAsAString) {
  for (const std::string text :
       {"",    "True", "null", "007", "1.",    ".5",  "+1",        "1 ",         " 1",  "0x10",
        "nan", "inf",  "1,5",  "-",   "1e999", "[1]", "{\"a\":1}", "\"quoted\"", "a=b", "1 2"}) {
    EXPECT_EQ(valueIn("k=" + text), Value(text)) << text;
  }
}

TEST(MessageTest, ReadsJSONAfterColonAndEqualsSign) {
  EXPECT_EQ(valueIn("k:=[1, 2.5, null]"), Value(Array{1, 2.5, nullptr}));
  EXPECT_EQ(valueIn(R"(k:={"a": "b"})"), Value(Dictionary{{"a", "b"}}));
  EXPECT_EQ(valueIn(R"(k:="12")"), Value("12"));
}

TEST(MessageTest, SplitsAtTheFirstEqualsSign) {
  const auto parsed = parseAssignment("a:b=c:=d");
  ASSERT_TRUE(parsed.value);
  EXPECT_EQ(*parsed.value, (Dictionary::Entry{"a:b", "c:=d"}));
}

TEST(MessageTest, SaysWhatIsWrongWithAnAssignment) {
  EXPECT_EQ(parseAssignment("abc").error, "\"abc\" is neither KEY=VALUE nor KEY:=JSON");
  EXPECT_EQ(parseAssignment("=1").error, "\"=1\" has no key");
  EXPECT_EQ(parseAssignment(":=1").error, "\":=1\" has no key");
  EXPECT_TRUE(parseAssignment("k:=[1").error.starts_with("the value of \"k\" is no usable JSON: "));
  EXPECT_FALSE(parseAssignment("k:=").value);
}

TEST(MessageTest, RefusesAKeyThatComesTwice) {
  EXPECT_EQ(parseAssignments({"a=1", "b=2"}).value, (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_EQ(parseAssignments({"a=1", "a:=2"}).error, "the key \"a\" comes twice");
  EXPECT_EQ(parseAssignments({"a=1", "b"}).error, "\"b\" is neither KEY=VALUE nor KEY:=JSON");
}

}  // namespace
}  // namespace tallyd::tallyctl
