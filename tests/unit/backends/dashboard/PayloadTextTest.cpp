#include "backends/dashboard/PayloadText.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <limits>
#include <vector>

namespace tallyd {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::Value;

constexpr std::size_t kArea = 1023;

std::string textOf(const Dictionary& payload, std::size_t area = kArea) {
  std::string text(area, '?');
  text.resize(writePayloadText(payload, text));
  return text;
}

TEST(PayloadTextTest, PutsTheShorterDescriptionFirst) {
  EXPECT_EQ(textOf({{"b", "xyz"}, {"a", 7}}), " a=7 b=xyz");
  EXPECT_EQ(textOf({{"a", "xyz"}, {"b", 7}}), " b=7 a=xyz");
  EXPECT_EQ(textOf({{"a", 12345}, {"b", Dictionary()}, {"c", "123"}}), " c=123 b=null a=12345");
}

TEST(PayloadTextTest, PutsEqualLengthsInTheOrderOfTheirKeys) {
  EXPECT_EQ(textOf({{"c", 1}, {"a", 2}, {"b", 3}}), " a=2 b=3 c=1");
}

TEST(PayloadTextTest, CountsAnEmptyTextAsShorterThanEverything) {
  EXPECT_EQ(textOf({{"a", 1}, {"b", ""}}), " b=empty a=1");
}

TEST(PayloadTextTest, MeasuresTheDescriptionBeforeItIsSanitized) {
  EXPECT_EQ(textOf({{"a", "=="}, {"b", "xyz"}}), " a=\\=\\= b=xyz");
  EXPECT_EQ(textOf({{"a", "\n\n\n\n"}, {"b", "xyz"}}), " b=xyz a=empty");
}

TEST(PayloadTextTest, CountsUTF16Units) {
  EXPECT_EQ(textOf({{"a", "ab"}, {"b", "é"}}), " b=é a=ab");              // One unit, two bytes.
  EXPECT_EQ(textOf({{"a", "abc"}, {"b", "😀"}}), " b=😀 a=abc");            // Two units, four bytes.
  EXPECT_EQ(textOf({{"a", "😀"}, {"b", "é"}}), " b=é a=😀");                // A surrogate pair is two.
  EXPECT_EQ(textOf({{"a", "\xFF\xFF"}, {"b", "x"}}), " b=x a=\xFF\xFF");  // Bytes that are no UTF-8 are kept.
}

TEST(PayloadTextTest, EscapesAndDeletesInValues) {
  EXPECT_EQ(sanitize("x=y\nz\\"), "x\\=yz\\\\");
  EXPECT_EQ(textOf({{"k", "x=y\nz\\"}}), " k=x\\=yz\\\\");
  EXPECT_EQ(sanitize("\\="), "\\\\\\=");
  EXPECT_EQ(sanitize("a\r\nb"), "a\rb");
  EXPECT_EQ(sanitize("plain text"), "plain text");
}

TEST(PayloadTextTest, SaysEmptyForNothing) {
  EXPECT_EQ(sanitize(""), "empty");
  EXPECT_EQ(sanitize("\n\n"), "empty");
  EXPECT_EQ(textOf({{"k", ""}}), " k=empty");
}

TEST(PayloadTextTest, LeavesKeysAsTheyStand) {
  EXPECT_EQ(textOf({{"k=\n\\", "v"}, {"", "w"}}), " =w k=\n\\=v");
}

TEST(PayloadTextTest, DescribesStringsAndNumbersOnly) {
  EXPECT_EQ(descriptionForObject("text"), "text");
  EXPECT_EQ(descriptionForObject(7), "7");
  EXPECT_EQ(descriptionForObject(-7), "-7");
  EXPECT_EQ(descriptionForObject(2.5), "2.5");
  EXPECT_EQ(descriptionForObject(true), "1");
  EXPECT_EQ(descriptionForObject(false), "0");
  EXPECT_EQ(descriptionForObject(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
  for (const Value& other : {Value(), Value(Date{1}), Value(Data("x")), Value(Array{1}),
                             Value(Dictionary{{"a", 1}}), Value(Dictionary())}) {
    EXPECT_EQ(descriptionForObject(other), "null") << other.description();
  }
}

TEST(PayloadTextTest, EndsTextAtANUL) {
  using namespace std::string_literals;
  EXPECT_EQ(textOf({{"k\0ey"s, "v\0alue"s}, {"l", 12}}), " l=12 k=v");
}

TEST(PayloadTextTest, FillsTheAreaAndCutsWithinAnItem) {
  EXPECT_EQ(textOf({{"key", "value"}}, 7), " key=va");
  EXPECT_EQ(textOf({{"key", "value"}}, 10), " key=value");
  EXPECT_EQ(textOf({{"key", "value"}}, 3), " ke");
  EXPECT_EQ(textOf({{"a", 1}, {"b", 22}}, 4), " a=1");
  EXPECT_EQ(textOf({{"a", 1}, {"b", 22}}, 5), " a=1 ");
  EXPECT_EQ(textOf({{"a", 1}}, 0), "");
}

TEST(PayloadTextTest, CutsWithinALetterAndKeepsItsFirstBytes) {
  EXPECT_EQ(textOf({{"k", "😀😀"}}, 9), " k=😀\xF0\x9F");
}

TEST(PayloadTextTest, WritesNothingForAnEmptyPayload) { EXPECT_EQ(textOf({}), ""); }

TEST(PayloadTextTest, TakesAMillionKeys) {
  std::vector<Dictionary::Entry> entries;
  for (int i = 0; i < 1'000'000; ++i) entries.push_back({fmt::format("k{:06}", i), "abc"});
  entries.push_back({"z", 5});
  const std::string text = textOf(Dictionary(std::move(entries)));
  EXPECT_EQ(text.size(), kArea);
  EXPECT_TRUE(text.starts_with(" z=5 k000000=abc k000001=abc k000002=abc "));
  EXPECT_TRUE(text.ends_with(" k000083=abc k000084=ab"));
}

TEST(PayloadTextTest, FitsAsManyOfTheShortestItemsAsThereIsRoomFor) {
  // Items of two bytes, of which no sort may leave one out.
  std::vector<Dictionary::Entry> entries;
  for (char c = 1; c < 127; ++c) entries.push_back({std::string(1, '\0') + c, std::string(1, '\0') + "long"});
  const Dictionary payload(std::move(entries));
  std::string expected;
  for (std::size_t i = 0; i < payload.size(); ++i) expected += " =";
  EXPECT_EQ(textOf(payload, 300), expected);
  EXPECT_EQ(textOf(payload, 101), expected.substr(0, 101));
}

TEST(PayloadTextTest, TakesLongTexts) {
  const std::string text = textOf({{"k", std::string(10'000'000, '=')}, {"short", "s"}});
  EXPECT_EQ(text.size(), kArea);
  EXPECT_TRUE(text.starts_with(" short=s k=\\=\\=\\="));
}

}  // namespace
}  // namespace tallyd
