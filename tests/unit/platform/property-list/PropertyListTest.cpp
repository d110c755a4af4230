#include "platform/property-list/PropertyList.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <vector>

#include "BinaryListBuilder.h"

namespace tallyd::platform {
namespace {

constexpr PropertyListFormat kFormats[] = {PropertyListFormat::XML, PropertyListFormat::Binary};

std::optional<Value> roundTrip(const Value& value, PropertyListFormat format) {
  const auto bytes = dataWithPropertyList(value, format);
  EXPECT_TRUE(bytes);
  return bytes ? propertyListWithData(*bytes).value : std::nullopt;
}

Value sample() {
  return Dictionary{
      {"string", "a & b <c> \"d\" é😀"},
      {"", "an empty key"},
      {"empty", Array{"", Array(), Dictionary(), Data()}},
      {"integers", Array{0, 1, -1, 255, 256, 65536, std::numeric_limits<std::int64_t>::max(),
                         std::numeric_limits<std::int64_t>::min(), std::int64_t{-4294967296},
                         std::numeric_limits<std::uint64_t>::max()}},
      {"reals", Array{0.1, -2.5, 0.0, 1e300, 5e-324, 1.0 / 3}},
      {"booleans", Array{true, false}},
      {"dates", Array{Date{0}, Date{1577934245}, Date{978307200}, Date{-5000000000}, Date{64092211200}}},
      {"data", Data(std::string("\0\1\xFF\0", 4))},
      {"nested", Array{Dictionary{{"k", Array{Dictionary{{"k", "v"}}}}}, "x", "x", "x"}}};
}

Value nestedArrays(int depth) {
  Value value = Array();
  for (int i = 1; i < depth; ++i) value = Array{std::move(value)};
  return value;
}

TEST(PropertyListTest, ReadsBackWhatItWrites) {
  for (const PropertyListFormat format : kFormats) {
    EXPECT_EQ(roundTrip(sample(), format), sample());
    const Value all = sample();
    for (const auto& [key, value] : *all.dictionary()) EXPECT_EQ(roundTrip(value, format), value) << key;
  }
}

TEST(PropertyListTest, WritesXMLToTheLetter) {
  const std::string text =
      dataWithPropertyList(Dictionary{{"a", Array{-1, true, "<x>"}}}, PropertyListFormat::XML).value_or("");
  EXPECT_TRUE(text.starts_with("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC "));
  EXPECT_EQ(
      text.substr(std::min(text.find("<plist"), text.size())),
      "<plist version=\"1.0\">\n<dict>\n\t<key>a</key>\n\t<array>\n\t\t<integer>-1</integer>\n\t\t<true/>\n"
      "\t\t<string>&lt;x&gt;</string>\n\t</array>\n</dict>\n</plist>\n");
}

TEST(PropertyListTest, WritesBinaryToTheLetter) {
  std::string expected = "bplist00\xD1\x01\x02\x51";
  expected += "a";
  expected += "\xA2\x03\x04\x13";
  expected += BinaryListBuilder::bigEndian(static_cast<std::uint64_t>(-1), 8);
  expected += '\x09';
  expected += std::string("\x08\x0B\x0D\x10\x19", 5);
  expected += std::string(6, '\0') + "\x01\x01" + BinaryListBuilder::bigEndian(5, 8) +
              BinaryListBuilder::bigEndian(0, 8) + BinaryListBuilder::bigEndian(0x1A, 8);
  EXPECT_EQ(dataWithPropertyList(Dictionary{{"a", Array{-1, true}}}, PropertyListFormat::Binary), expected);
}

TEST(PropertyListTest, BinaryKeepsDatesToTheMicrosecondAndXMLToTheSecond) {
  for (const double seconds : {1577934245.5, 1577934245.123456, 1577934245.999999, 978307200.25, 978307199.5,
                               978307198.75, -0.25, 0.000001, 1700000000.1}) {
    EXPECT_EQ(roundTrip(Date{seconds}, PropertyListFormat::Binary), Value(Date{seconds})) << seconds;
    EXPECT_EQ(roundTrip(Date{seconds}, PropertyListFormat::XML), Value(Date{std::floor(seconds)})) << seconds;
  }
  const auto close = roundTrip(Date{1577934245.9999999}, PropertyListFormat::Binary);
  ASSERT_TRUE(close && close->date());
  EXPECT_NEAR(close->date()->secondsSince1970, 1577934245.9999999, 1e-6);
}

TEST(PropertyListTest, WritesDatesFromTheFirstToTheLastYear) {
  for (const PropertyListFormat format : kFormats) {
    // Around both ends of 32 bits of seconds from 2001 too.
    for (const double seconds : {-62135596800.0, 253402300799.0, -1169176447.0, -1169176448.0, -1169176449.0,
                                 3125790846.0, 3125790847.0, 3125790848.0, -30000000000.0}) {
      EXPECT_EQ(roundTrip(Date{seconds}, format), Value(Date{seconds})) << seconds;
    }
    for (const double seconds : {-62135596801.0, 253402300800.0, 1e300, -1e300, std::nan(""),
                                 std::numeric_limits<double>::infinity()}) {
      EXPECT_FALSE(dataWithPropertyList(Date{seconds}, format)) << seconds;
    }
  }
}

TEST(PropertyListTest, WritesRealsThatAreNoNumbers) {
  for (const PropertyListFormat format : kFormats) {
    EXPECT_EQ(roundTrip(std::numeric_limits<double>::infinity(), format),
              Value(std::numeric_limits<double>::infinity()));
    EXPECT_EQ(roundTrip(-std::numeric_limits<double>::infinity(), format),
              Value(-std::numeric_limits<double>::infinity()));
    const auto notANumber = roundTrip(std::nan(""), format);
    ASSERT_TRUE(notANumber && notANumber->realValue());
    EXPECT_TRUE(std::isnan(*notANumber->realValue()));
  }
}

TEST(PropertyListTest, ReplacesWhatStringsCannotCarry) {
  for (const PropertyListFormat format : kFormats) {
    EXPECT_EQ(roundTrip(std::string("a\0b", 3), format), Value("a\uFFFDb"));
    EXPECT_EQ(roundTrip("a\xFF", format), Value("a\uFFFD"));
    EXPECT_EQ(roundTrip(Dictionary{{std::string("k\0\xC3", 3), 1}}, format),
              Value(Dictionary{{"k\uFFFD\uFFFD", 1}}));
  }
  EXPECT_EQ(roundTrip("\x01\t\n\uFFFF", PropertyListFormat::XML), Value("\uFFFD\t\n\uFFFD"));
  EXPECT_EQ(roundTrip("\x01\t\n\uFFFF", PropertyListFormat::Binary), Value("\x01\t\n\uFFFF"));
}

TEST(PropertyListTest, WritesNothingForWhatNoFormatCanHold) {
  for (const PropertyListFormat format : kFormats) {
    EXPECT_FALSE(dataWithPropertyList(Value(), format));
    EXPECT_FALSE(dataWithPropertyList(Array{1, Dictionary{{"k", nullptr}}}, format));
    EXPECT_TRUE(dataWithPropertyList(nestedArrays(kMaximumPropertyListDepth), format));
    EXPECT_FALSE(dataWithPropertyList(nestedArrays(kMaximumPropertyListDepth + 1), format));
  }
}

TEST(PropertyListTest, ReadsBackNestingAtItsBound) {
  for (const PropertyListFormat format : kFormats) {
    EXPECT_EQ(roundTrip(nestedArrays(kMaximumPropertyListDepth), format),
              nestedArrays(kMaximumPropertyListDepth));
  }
}

TEST(PropertyListTest, ReadsBackLargeLists) {
  std::vector<Dictionary::Entry> entries;
  for (int i = 0; i < 20'000; ++i) entries.push_back({"key" + std::to_string(i), Array{i, "same text"}});
  const Value value = Dictionary(std::move(entries));
  for (const PropertyListFormat format : kFormats) EXPECT_EQ(roundTrip(value, format), value);
}

TEST(PropertyListTest, EmptyInputIsAnError) {
  for (const char* text : {"", " ", "\n\t\r\n", "\xEF\xBB\xBF"}) {
    const PropertyListResult result = propertyListWithData(text);
    EXPECT_FALSE(result.value);
    EXPECT_EQ(result.error, "property list: empty");
  }
}

/// What every read of hostile bytes must hold to. The bytes are copied, so that the sanitizer sees a read
/// past their end.
void readHostile(std::string_view bytes) {
  const std::vector<char> copy(bytes.begin(), bytes.end());
  const PropertyListResult result = propertyListWithData({copy.data(), copy.size()});
  ASSERT_NE(result.value.has_value(), !result.error.empty());
}

TEST(PropertyListTest, SurvivesTruncationAtEveryByte) {
  const std::string ascii = "{ a = (b, \"c\\U00e9\", <00ff>); /* d */ 'e' = { }; }";
  for (const std::string& bytes : {*dataWithPropertyList(sample(), PropertyListFormat::XML),
                                   *dataWithPropertyList(sample(), PropertyListFormat::Binary), ascii}) {
    ASSERT_TRUE(propertyListWithData(bytes).value);
    const std::size_t end = bytes.find_last_not_of('\n') + 1;
    for (std::size_t length = 0; length < end; ++length) {
      readHostile(std::string_view(bytes).substr(0, length));
      // The first letters of a binary list are a bare string of the ASCII form.
      const auto value = propertyListWithData(std::string_view(bytes).substr(0, length)).value;
      EXPECT_FALSE(value && value->dictionary()) << length;
    }
  }
}

TEST(PropertyListTest, SurvivesMutations) {
  const std::string ascii = "{ a = (b, \"c\\U00e9\", <00ff>); /* d */ 'e' = { }; }";
  std::mt19937 random(11);
  for (const std::string& bytes : {*dataWithPropertyList(sample(), PropertyListFormat::XML),
                                   *dataWithPropertyList(sample(), PropertyListFormat::Binary), ascii}) {
    for (int i = 0; i < 20'000; ++i) {
      std::string mutant = bytes;
      for (auto changes = random() % 6 + 1; changes > 0; --changes) {
        const std::size_t place = random() % mutant.size();
        switch (random() % 3) {
          case 0:
            mutant[place] = static_cast<char>(random());
            break;
          case 1:
            mutant.erase(place, random() % 4);
            break;
          default:
            mutant.insert(place, mutant.substr(random() % mutant.size(), random() % 8));
        }
        if (mutant.empty()) mutant = "x";
      }
      readHostile(mutant);
    }
  }
}

}  // namespace
}  // namespace tallyd::platform
