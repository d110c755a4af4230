#include "station/ReadableText.h"

#include <gtest/gtest.h>

#include <limits>

namespace tallyd::station {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::Value;

namespace {

const Dictionary kEvent{{"_sender", "PH"}, {"_sessionID", "42"},  {"_method", "7"},
                        {"_status", "2"},  {"_eventNumber", "3"}, {"_osVersion", "12"},
                        {"count", 5},      {"name", "two words"}, {"eventTime", "1772366401.250"}};

}  // namespace

TEST(ReadableTextTest, ShowsTheFieldsOfAnEventInOneLine) {
  EXPECT_EQ(readableEvent(kEvent),
            "2026-03-01 12:00:01.250  PH  session 42  method 7  status 2  #3  count=5 name=\"two words\"");
}

TEST(ReadableTextTest, ShowsWhatIsMissingOrOddAsItIs) {
  EXPECT_EQ(readableEvent(Dictionary{}), "-  -  session -  method -  status -  #-");
  EXPECT_EQ(readableEvent(Dictionary{{"eventTime", "soon"}, {"list", Array{Value(1), Value(true)}}}),
            "soon  -  session -  method -  status -  #-  list=\"[1,true]\"");
  EXPECT_EQ(readableEvent(Dictionary{{"eventTime", "1e300"}}), "1e300  -  session -  method -  status -  #-");
}

TEST(ReadableTextTest, EscapesWhatATerminalWouldObey) {
  const std::string line = readableEvent(Dictionary{{"key\x1b[2J", "value\n\x1b[31m"}});
  EXPECT_EQ(line.find('\x1b'), std::string::npos);
  EXPECT_EQ(line.find('\n'), std::string::npos);
}

TEST(ReadableTextTest, EscapesTheControlsThatJSONLeavesAsTheyAre) {
  EXPECT_EQ(readableText("a\x7f"), "\"a\\u007f\"");
  EXPECT_EQ(readableText("\xC2\x9B"
                         "2J"),
            "\"\\u009b2J\"");
  EXPECT_EQ(readableText("\xC2\xA9"), "\"\xC2\xA9\"");
}

TEST(ReadableTextTest, GivesJSONAFormForEveryValue) {
  const Dictionary record{{"at", Date{1772366401.25}},
                          {"bytes", Data("hi")},
                          {"none", nullptr},
                          {"list", Array{Data("hi"), true, 5, 1.5, "text"}},
                          {"big", std::numeric_limits<double>::infinity()}};
  const std::string text = recordOf(record);
  EXPECT_NE(text.find(R"("at":{"date":"2026-03-01 12:00:01.250"})"), std::string::npos) << text;
  EXPECT_NE(text.find(R"("bytes":{"data":"aGk="})"), std::string::npos) << text;
  EXPECT_NE(text.find(R"("none":null)"), std::string::npos) << text;
  EXPECT_NE(text.find(R"("list":[{"data":"aGk="},true,5,1.5,"text"])"), std::string::npos) << text;
  EXPECT_NE(text.find(R"("big":")"), std::string::npos) << text;
}

TEST(ReadableTextTest, ShortensBetweenCharacters) {
  EXPECT_EQ(shortened("abc", 3), "abc");
  EXPECT_EQ(shortened("abcd", 3), "abc…");
  EXPECT_EQ(shortened("aü-", 2), "a…");
}

}  // namespace tallyd::station
