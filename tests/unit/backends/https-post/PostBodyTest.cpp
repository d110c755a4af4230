#include "backends/https-post/PostBody.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "fakes/FakeLog.h"

namespace tallyd {
namespace {

using fakes::FakeLog;
using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::LogLevel;
using platform::Value;

FakeLog::Line removal(std::string_view key, std::string_view value) {
  return {LogLevel::Warning, "Tally: NSJSONSerialization unable to handle key: " + std::string(key) +
                                 ", value: " + std::string(value)};
}

Dictionary sanitized(const Dictionary& event, FakeLog& log) {
  EventFields fields(event);
  sanitizeEventForJSON(fields, log);
  return fields.dictionary();
}

std::string postTimeAt(timeval time) { return postBody(time, std::nullopt, "[]"); }

TEST(SanitizeEventForJSONTest, KeepsStringsAndFiniteNumbersAsTheyAre) {
  FakeLog log;
  const Dictionary event{{"text", "x"},   {"empty", ""},
                         {"integer", -5}, {"large", Value(std::numeric_limits<std::uint64_t>::max())},
                         {"real", 1.5},   {"boolean", true}};
  EXPECT_EQ(sanitized(event, log), event);
  EXPECT_TRUE(log.lines().empty());
}

TEST(SanitizeEventForJSONTest, TurnsADateIntoTheTextOfItsSeconds) {
  FakeLog log;
  const Dictionary event{{"late", Date{1'768'478'400.12345}}, {"early", Date{-0.5}}, {"epoch", Date{0}}};
  EXPECT_EQ(sanitized(event, log),
            (Dictionary{{"late", "1768478400.123"}, {"early", "-0.500"}, {"epoch", "0.000"}}));
  EXPECT_TRUE(log.lines().empty());
}

TEST(SanitizeEventForJSONTest, RemovesEveryOtherKindWithAWarning) {
  FakeLog log;
  const Dictionary event{{"a", Array{"x", 1}},
                         {"b", Dictionary{{"k", "v"}}},
                         {"c", Value()},
                         {"d", Data("\x01\xff")},
                         {"kept", 1}};
  EXPECT_EQ(sanitized(event, log), (Dictionary{{"kept", 1}}));
  EXPECT_EQ(log.lines(), (std::vector<FakeLog::Line>{removal("a", "(x, 1)"), removal("b", "{k = v; }"),
                                                     removal("c", "(null)"), removal("d", "<01ff>")}));
}

TEST(SanitizeEventForJSONTest, RemovesNumbersThatAreNone) {
  FakeLog log;
  const Dictionary event{{"inf", std::numeric_limits<double>::infinity()},
                         {"nan", std::nan("")},
                         {"neg", -std::numeric_limits<double>::infinity()}};
  EXPECT_EQ(sanitized(event, log), Dictionary());
  EXPECT_EQ(log.lines(), (std::vector<FakeLog::Line>{removal("inf", "inf"), removal("nan", "nan"),
                                                     removal("neg", "-inf")}));
}

TEST(PostBodyTest, PadsTheMillisecondsWithBlanks) {
  EXPECT_EQ(postTimeAt({1'768'478'400, 5'000}), R"({"postTime":"1768478400.  5"})");
  EXPECT_EQ(postTimeAt({1'768'478'400, 0}), R"({"postTime":"1768478400.  0"})");
  EXPECT_EQ(postTimeAt({1'768'478'400, 42'999}), R"({"postTime":"1768478400. 42"})");
  EXPECT_EQ(postTimeAt({1'768'478'400, 999'999}), R"({"postTime":"1768478400.999"})");
  EXPECT_EQ(postTimeAt({0, 999}), R"({"postTime":"0.  0"})");
}

TEST(PostBodyTest, HoldsTimeIdentifierAndEventsCompactly) {
  EXPECT_EQ(postBody({1, 100'000}, "me", R"([{"n":1},{"t":"x"}])"),
            R"({"clientId":"me","events":[{"n":1},{"t":"x"}],"postTime":"1.100"})");
  EXPECT_EQ(postBody({1, 100'000}, "", "[]"), R"({"clientId":"","events":[],"postTime":"1.100"})");
}

TEST(PostBodyTest, EndsBehindThePostTimeWithoutAClientIdentifier) {
  EXPECT_EQ(postBody({1, 100'000}, std::nullopt, R"([{"n":1}])"), R"({"postTime":"1.100"})");
}

TEST(PostBodyTest, WritesTheClientIdentifierAsJSON) {
  EXPECT_EQ(postBody({1, 0}, "a\"b", "[]"), R"({"clientId":"a\"b","events":[],"postTime":"1.  0"})");
}

TEST(AppendEventTest, WritesValuesTextsAndWhatIsJSONAlready) {
  const Value number = 1.5;
  EventFields fields;
  fields.append({.key = "a", .value = &number});
  fields.append({.key = "b", .text = "two\n"});
  fields.append({.key = "c", .text = "three", .json = R"("c":"three")"});
  platform::JSONText json;
  appendEvent(json, fields);
  fields.clear();
  appendEvent(json, fields);
  EXPECT_EQ(json.view(), R"({"a":1.5,"b":"two\n","c":"three"},{})");
}

}  // namespace
}  // namespace tallyd
