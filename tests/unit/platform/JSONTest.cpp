#include "platform/JSON.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>

namespace tallyd::platform {
namespace {

std::string json(const Value& value) { return jsonFromValue(value).value_or("(nothing)"); }

Value nestedArrays(int depth) {
  Value value;
  for (int i = 0; i < depth; ++i) value = Array{std::move(value)};
  return value;
}

TEST(JSONTest, WritesEveryKindCompactly) {
  EXPECT_EQ(json(Value()), "null");
  EXPECT_EQ(json(true), "true");
  EXPECT_EQ(json(false), "false");
  EXPECT_EQ(json(-5), "-5");
  EXPECT_EQ(json(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
  EXPECT_EQ(json(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
  EXPECT_EQ(json(0.1), "0.1");
  EXPECT_EQ(json(2.0), "2.0");
  EXPECT_EQ(json("text"), "\"text\"");
  EXPECT_EQ(json(Array()), "[]");
  EXPECT_EQ(json(Dictionary()), "{}");
  EXPECT_EQ(json(Dictionary{{"b", Array{1, "x", Value()}}, {"a", Dictionary{{"c", true}}}}),
            R"({"a":{"c":true},"b":[1,"x",null]})");
}

TEST(JSONTest, EscapesWhatAStringMayNotHold) {
  EXPECT_EQ(json("\"\\/\b\f\n\r\t"), R"("\"\\/\b\f\n\r\t")");
  EXPECT_EQ(json(std::string("\0\x01\x1F\x7F", 4)), "\"\\u0000\\u0001\\u001F\x7F\"");
  EXPECT_EQ(json(Dictionary{{"k\n", 1}}), R"({"k\n":1})");
}

TEST(JSONTest, EscapesAtEveryPlaceWithinAString) {
  // Around the width at which runs are copied.
  for (std::size_t length = 0; length < 40; ++length) {
    for (std::size_t place = 0; place <= length; ++place) {
      for (const auto& [special, escaped] : {std::pair<std::string, std::string>{"\"", "\\\""},
                                             {"\\", "\\\\"},
                                             {"\x1F", "\\u001F"},
                                             {"é", "é"},
                                             {"\xFF", "\uFFFD"},
                                             {"!", "!"},
                                             {" ", " "},
                                             {"\x7F", "\x7F"}}) {
        const std::string before(place, 'a');
        const std::string after(length - place, '~');
        EXPECT_EQ(json(before + special + after), '"' + before + escaped + after + '"');
      }
    }
  }
}

TEST(JSONTest, KeepsUTF8AndReplacesWhatIsNone) {
  EXPECT_EQ(json("é€😀"), "\"é€😀\"");
  EXPECT_EQ(json("a\xC3"), "\"a\uFFFD\"");
  EXPECT_EQ(json("\xED\xA0\x80 plain text behind"), "\"\uFFFD\uFFFD\uFFFD plain text behind\"");
}

TEST(JSONTest, WritesNothingForWhatJSONCannotHold) {
  EXPECT_FALSE(jsonFromValue(Date{0}));
  EXPECT_FALSE(jsonFromValue(Data("x")));
  EXPECT_FALSE(jsonFromValue(std::nan("")));
  EXPECT_FALSE(jsonFromValue(std::numeric_limits<double>::infinity()));
  EXPECT_FALSE(jsonFromValue(Array{1, Dictionary{{"k", Data()}}}));
}

TEST(JSONTest, WritesNestingUpToItsBoundOnly) {
  EXPECT_TRUE(jsonFromValue(nestedArrays(kMaximumValueDepth)));
  EXPECT_FALSE(jsonFromValue(nestedArrays(kMaximumValueDepth + 1)));
  EXPECT_TRUE(
      jsonFromValue(Array{nestedArrays(kMaximumValueDepth - 1), nestedArrays(kMaximumValueDepth - 1)}));
}

TEST(JSONTextTest, SeparatesWhatIsWrittenPieceByPiece) {
  JSONText json;
  json.startObject();
  json.key("list");
  json.startArray();
  EXPECT_TRUE(json.value(1));
  EXPECT_TRUE(json.value(Dictionary{{"a", true}, {"b", Value()}}));
  json.text("x\"y");
  json.startArray();
  json.endArray();
  json.endArray();
  json.written(R"("ready":"made")");
  json.key("last");
  json.written("[1,2]");
  json.endObject();
  EXPECT_EQ(json.view(), R"({"list":[1,{"a":true,"b":null},"x\"y",[]],"ready":"made","last":[1,2]})");
}

TEST(JSONTextTest, SaysThatAValueCannotBeWritten) {
  JSONText json(100);
  EXPECT_FALSE(json.value(Date{1}));
  EXPECT_FALSE(json.value(std::numeric_limits<double>::infinity()));
}

TEST(JSONTest, ReadsEveryKind) {
  const JSONResult result = valueFromJSON(
      R"( {"n":null,"t":true,"f":false,"i":-7,"u":18446744073709551615,"r":1.5e3,"s":"a\u00e9\ud83d\ude00\n","a":[1,[]],"o":{}} )");
  ASSERT_TRUE(result.value) << result.error;
  EXPECT_EQ(result.error, "");
  EXPECT_EQ(*result.value, Value(Dictionary{{"n", Value()},
                                            {"t", true},
                                            {"f", false},
                                            {"i", -7},
                                            {"u", std::numeric_limits<std::uint64_t>::max()},
                                            {"r", 1500.0},
                                            {"s", "aé😀\n"},
                                            {"a", Array{1, Array()}},
                                            {"o", Dictionary()}}));
}

TEST(JSONTest, ReadsIntegersWithAll64BitsAndLargerOnesAsReals) {
  EXPECT_EQ(valueFromJSON("9223372036854775807").value, Value(std::numeric_limits<std::int64_t>::max()));
  EXPECT_EQ(valueFromJSON("-9223372036854775808").value, Value(std::numeric_limits<std::int64_t>::min()));
  EXPECT_EQ(valueFromJSON("18446744073709551616").value, Value(18446744073709551616.0));
  EXPECT_EQ(valueFromJSON("184467440737095516158").value, Value(184467440737095516158.0));
  EXPECT_EQ(valueFromJSON("4294967295").value, Value(std::int64_t{4294967295}));
}

TEST(JSONTest, OfEqualKeysTheLastStays) {
  EXPECT_EQ(valueFromJSON(R"({"a":1,"b":2,"a":3})").value, Value(Dictionary{{"a", 3}, {"b", 2}}));
}

TEST(JSONTest, PassesOverAByteOrderMark) {
  EXPECT_EQ(valueFromJSON("\xEF\xBB\xBF[1]").value, Value(Array{1}));
}

TEST(JSONTest, NamesTheErrorAndItsPlace) {
  const auto error = [](std::string_view text) {
    const JSONResult result = valueFromJSON(text);
    EXPECT_FALSE(result.value) << text;
    return result.error;
  };
  EXPECT_EQ(error(""), "The document is empty. (at byte 0)");
  EXPECT_EQ(error("[1,]"), "Invalid value. (at byte 3)");
  EXPECT_EQ(error("[1] 2"), "The document root must not be followed by other values. (at byte 4)");
  EXPECT_EQ(error(std::string("[1]\0[2]", 7)),
            "The document root must not be followed by other values. (at byte 3)");
  EXPECT_EQ(error("\"a"), "Missing a closing quotation mark in string. (at byte 2)");
  EXPECT_NE(error("\"\xFF\"").find("Invalid encoding"), std::string::npos);
  for (const char* lone : {R"("\udc00")", R"({"a\ude00":1})", R"("\ud800")", R"("\ud800\ud800")"}) {
    EXPECT_EQ(error(lone).substr(0, 40), "The surrogate pair in string is invalid.") << lone;
  }
  for (const char* text : {"{", "{\"a\"}", "{1:2}", "nul", "01", "NaN", "'a'", "[1 2]", "1e999"}) {
    EXPECT_NE(error(text), "");
  }
}

TEST(JSONTest, ReadsNestingUpToItsBoundOnly) {
  const auto nested = [](int depth) {
    return std::string(static_cast<std::size_t>(depth), '[') +
           std::string(static_cast<std::size_t>(depth), ']');
  };
  EXPECT_TRUE(valueFromJSON(nested(kMaximumValueDepth)).value);
  const JSONResult tooDeep = valueFromJSON(nested(kMaximumValueDepth + 1));
  EXPECT_FALSE(tooDeep.value);
  EXPECT_EQ(tooDeep.error.substr(0, 30), "nested deeper than 128 levels,");
  EXPECT_FALSE(valueFromJSON(std::string(1'000'000, '[')).value);
  std::string objects;
  for (int i = 0; i < 100'000; ++i) objects += "{\"a\":";
  EXPECT_FALSE(valueFromJSON(objects).value);
}

TEST(JSONTest, ReadsTheLargestNumbersThatThereAre) {
  for (const double largest : {std::numeric_limits<double>::max(), std::numeric_limits<double>::lowest()}) {
    const auto text = jsonFromValue(Value(largest));
    ASSERT_TRUE(text);
    EXPECT_EQ(valueFromJSON(*text).value, Value(largest)) << *text;
    EXPECT_EQ(valueFromJSON("[1," + *text + "]").value, (Value(Array{1, largest})));
  }
  for (const char* larger : {"[1.7976931348623159e308]", "[-0.9e309]", "9e308", "1e99999"}) {
    EXPECT_EQ(valueFromJSON(larger).error.substr(0, 44), "Number too big to be stored in double. (at b")
        << larger;
  }
}

TEST(JSONTest, ReadsZerosOfAnyExponentAndWhatIsNextToZero) {
  for (const char* zero : {"0e48", "0e308", "0.0e-5", "0e-99999999999", "1e-400", "1e-99999", "-0"}) {
    EXPECT_EQ(valueFromJSON(zero).value->realValue(), 0.0) << zero;
  }
  EXPECT_TRUE(std::signbit(*valueFromJSON("-0.0").value->realValue()));
  EXPECT_EQ(valueFromJSON("5e-324").value, Value(std::numeric_limits<double>::denorm_min()));
  EXPECT_EQ(valueFromJSON("0." + std::string(400, '0') + "1").value, Value(0.0));
}

TEST(JSONTest, ReadsBackWhatItWrites) {
  const Value value =
      Dictionary{{"ключ", Array{1, -2.25, 1e300, "a\"b\\c\x01", true, Value(), Dictionary{{"", ""}}}}};
  EXPECT_EQ(valueFromJSON(json(value)).value, value);
}

TEST(JSONTest, SurvivesTruncationsAndMutations) {
  const std::string sample =
      R"({"a":[1,-2,3.5e-10,true,null,"x\u00e9\ud83d\ude00"],"long":"text that is longer than a word","o":{"k":{}}})";
  ASSERT_TRUE(valueFromJSON(sample).value);
  for (std::size_t length = 0; length < sample.size(); ++length) {
    // Copied, so that the sanitizer sees a read past the end.
    const std::vector<char> cut(sample.begin(), sample.begin() + static_cast<std::ptrdiff_t>(length));
    EXPECT_FALSE(valueFromJSON({cut.data(), cut.size()}).value);
  }
  std::mt19937 random(7);
  for (int i = 0; i < 20'000; ++i) {
    std::string mutant = sample;
    for (auto changes = random() % 4 + 1; changes > 0; --changes) {
      mutant[random() % mutant.size()] = static_cast<char>(random());
    }
    const JSONResult result = valueFromJSON(mutant);
    EXPECT_NE(result.value.has_value(), !result.error.empty());
    if (result.value) {
      EXPECT_TRUE(jsonFromValue(*result.value));
    }
  }
}

}  // namespace
}  // namespace tallyd::platform
