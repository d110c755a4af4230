#include <gtest/gtest.h>

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {
namespace {

Value read(std::string_view text) {
  const PropertyListResult result = propertyListWithData(text);
  EXPECT_TRUE(result.value) << text << ": " << result.error;
  EXPECT_EQ(result.error, "");
  if (!result.value) return {};
  return *result.value;
}

std::string error(std::string_view text) {
  const PropertyListResult result = propertyListWithData(text);
  EXPECT_FALSE(result.value) << text;
  return result.error;
}

TEST(ASCIIPropertyListTest, ReadsDictionariesArraysStringsAndData) {
  EXPECT_EQ(read(R"({
    // what it is for
    Name = "a \"quoted\" text";
    'other key' = ( one, two-2, "three", ( ), { } ); /* and
    a long comment */
    Data = <48656c 6c 6F>;
    path = /usr/lib/a_b.c$d:e;
  })"),
            Value(Dictionary{{"Name", "a \"quoted\" text"},
                             {"other key", Array{"one", "two-2", "three", Array(), Dictionary()}},
                             {"Data", Data("Hello")},
                             {"path", "/usr/lib/a_b.c$d:e"}}));
}

TEST(ASCIIPropertyListTest, AnyValueMayBeAtTheTop) {
  EXPECT_EQ(read("bare"), Value("bare"));
  EXPECT_EQ(read(" \"\" "), Value(""));
  EXPECT_EQ(read("<>"), Value(Data()));
  EXPECT_EQ(read("<da7a>"), Value(Data("\xDA\x7A")));
  EXPECT_EQ(read("()"), Value(Array()));
  EXPECT_EQ(read("\xEF\xBB\xBF{}"), Value(Dictionary()));
  EXPECT_EQ(read("// first\n{}// last"), Value(Dictionary()));
}

TEST(ASCIIPropertyListTest, NumbersAreStrings) { EXPECT_EQ(read("(1, -2.5)"), Value(Array{"1", "-2.5"})); }

TEST(ASCIIPropertyListTest, TheLastSeparatorIsOptional) {
  EXPECT_EQ(read("(a, b,)"), Value(Array{"a", "b"}));
  EXPECT_EQ(read("{a = 1; b = 2}"), Value(Dictionary{{"a", "1"}, {"b", "2"}}));
}

TEST(ASCIIPropertyListTest, ResolvesEscapes) {
  EXPECT_EQ(read(R"("\a\b\f\n\r\t\v\\\"\'\q")"), Value("\a\b\f\n\r\t\v\\\"'q"));
  EXPECT_EQ(read("\"one\\\nline\""), Value("oneline"));
  EXPECT_EQ(read(R"("\101\1012\7")"), Value("AA2\a"));
  EXPECT_EQ(read(R"("\351")"), Value("é"));
  EXPECT_EQ(read(R"("\U00e9\u20AC\Ud83d\Ude00")"), Value("é€😀"));
  EXPECT_EQ(read(R"("\Ud83d!\Ude00")"), Value("\uFFFD!\uFFFD"));
  EXPECT_EQ(read(R"("\Ud83d\U0041")"), Value("\uFFFDA"));
  EXPECT_EQ(read(R"("\000x")"), Value(std::string("\0x", 2)));
}

TEST(ASCIIPropertyListTest, KeepsUTF8AndReplacesWhatIsNone) {
  EXPECT_EQ(read("\"é\xFF\""), Value("é\uFFFD"));
}

TEST(ASCIIPropertyListTest, OfEqualKeysTheLastStays) {
  EXPECT_EQ(read("{a = 1; a = 2;}"), Value(Dictionary{{"a", "2"}}));
}

TEST(ASCIIPropertyListTest, NamesTheErrorAndItsPlace) {
  EXPECT_EQ(error("{a 1;}"), "ASCII property list: '=' is missing at byte 3");
  EXPECT_EQ(error("{a = 1 b = 2;}"), "ASCII property list: ';' is missing at byte 7");
  EXPECT_EQ(error("(a b)"), "ASCII property list: ',' is missing at byte 3");
  EXPECT_EQ(error("(a, b"), "ASCII property list: ',' is missing at byte 5");
  EXPECT_EQ(error("(a,"), "ASCII property list: the list ends where a value is due at byte 3");
  EXPECT_EQ(error("(,)"), "ASCII property list: no value begins with this at byte 1");
  EXPECT_EQ(error("\"abc"), "ASCII property list: string without an end at byte 4");
  EXPECT_EQ(error("\"abc\\"), "ASCII property list: string without an end at byte 5");
  EXPECT_EQ(error("<abc>"), "ASCII property list: odd number of digits in data at byte 4");
  EXPECT_EQ(error("<ab xy>"), "ASCII property list: '>' is missing at byte 4");
  EXPECT_EQ(error("{} {}"), "ASCII property list: text after the end of the list at byte 3");
  EXPECT_EQ(error("two words"), "ASCII property list: text after the end of the list at byte 4");
  EXPECT_EQ(error("/* no end"), "ASCII property list: comment without an end at byte 0");
  EXPECT_EQ(error("{} /* no end"), "ASCII property list: comment without an end at byte 3");
  EXPECT_EQ(error(std::string_view("\0", 1)), "ASCII property list: no value begins with this at byte 0");
}

TEST(ASCIIPropertyListTest, ReadsNestingUpToItsBoundOnly) {
  const auto nested = [](std::size_t depth) { return std::string(depth, '(') + std::string(depth, ')'); };
  EXPECT_TRUE(propertyListWithData(nested(kMaximumPropertyListDepth)).value);
  EXPECT_NE(error(nested(kMaximumPropertyListDepth + 1)).find("nested too deep"), std::string::npos);
  EXPECT_NE(error(std::string(100'000, '(')).find("nested too deep"), std::string::npos);
  std::string dictionaries;
  for (int i = 0; i < 100'000; ++i) dictionaries += "{a=";
  EXPECT_NE(error(dictionaries).find("nested too deep"), std::string::npos);
}

}  // namespace
}  // namespace tallyd::platform
