#include "platform/power-log/PowerLogLine.h"

#include <gtest/gtest.h>

#include <limits>

#include "platform/JSON.h"

namespace tallyd::platform {
namespace {

constexpr TimePoint kTime{std::chrono::milliseconds(1'768'478'400'250)};

Dictionary recordIn(const std::string& line) {
  EXPECT_EQ(line.back(), '\n');
  EXPECT_EQ(line.find('\n'), line.size() - 1);
  const auto parsed = valueFromJSON(line);
  EXPECT_TRUE(parsed.value) << parsed.error;
  const Dictionary* record = parsed.value ? parsed.value->dictionary()->dictionary("record") : nullptr;
  EXPECT_NE(record, nullptr) << line;
  return record ? *record : Dictionary();
}
Dictionary written(const Dictionary& record) { return recordIn(powerLogLine(kTime, 28, "N", record)); }

TEST(PowerLogLineTest, IsAnObjectWithTimeNumberNameAndRecord) {
  EXPECT_EQ(powerLogLine(kTime, 28, "StagehostD-RTC",
                         {{"event", 7}, {"text", "a \"b\"\n"}, {"ok", true}, {"real", 1.5}}),
            "{\"time\": 1768478400.250000, \"number\": 28, \"name\": \"StagehostD-RTC\", \"record\": "
            "{\"event\":7,\"ok\":true,\"real\":1.5,\"text\":\"a \\\"b\\\"\\n\"}}\n");
}

TEST(PowerLogLineTest, EscapesTheName) {
  EXPECT_EQ(powerLogLine(TimePoint(), -1, "\"\n", {}),
            "{\"time\": 0.000000, \"number\": -1, \"name\": \"\\\"\\n\", \"record\": {}}\n");
}

TEST(PowerLogLineTest, WritesInAnotherWayWhatJSONCannotTake) {
  const Dictionary record = written({{"date", Date{12.5}},
                                     {"data", Data(std::string("\0\xFF", 2))},
                                     {"nan", std::numeric_limits<double>::quiet_NaN()},
                                     {"infinite", -std::numeric_limits<double>::infinity()},
                                     {"endless", Date{std::numeric_limits<double>::infinity()}},
                                     {"null", Value()},
                                     {"inside", Array{Date{-1}, Dictionary{{"data", Data("a")}}, "plain", 5}},
                                     {"text", "\xFF"}});
  EXPECT_EQ(record, (Dictionary{{"date", 12.5},
                                {"data", "AP8="},
                                {"nan", Value()},
                                {"infinite", Value()},
                                {"endless", Value()},
                                {"null", Value()},
                                {"inside", Array{-1.0, Dictionary{{"data", "YQ=="}}, "plain", 5}},
                                {"text", "\xEF\xBF\xBD"}}));
}

TEST(PowerLogLineTest, CutsOffWhatIsNestedTooDeep) {
  Value nested = Array{"innermost"};
  for (int depth = 1; depth < kMaximumValueDepth; ++depth) nested = Array{nested};
  // The record is one level more than may be.
  const auto description = Value(written({{"deep", nested}, {"flat", 1}})).description();
  EXPECT_EQ(description.find("innermost"), std::string::npos);
  EXPECT_NE(description.find("(null)"), std::string::npos);
  EXPECT_NE(description.find("flat = 1"), std::string::npos);
}

}  // namespace
}  // namespace tallyd::platform
