#include "platform/property-list/BinaryPropertyList.h"

#include <gtest/gtest.h>

#include <limits>

#include "BinaryListBuilder.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {
namespace {

using namespace std::string_literals;

Value read(std::string_view bytes) {
  const PropertyListResult result = propertyListWithData(bytes);
  EXPECT_TRUE(result.value) << result.error;
  if (!result.value) return {};
  return *result.value;
}

std::string error(std::string_view bytes) {
  const PropertyListResult result = propertyListWithData(bytes);
  EXPECT_FALSE(result.value);
  return result.error;
}

std::string bigEndian(std::uint64_t number, std::size_t width) {
  return BinaryListBuilder::bigEndian(number, width);
}

TEST(BinaryPropertyListTest, ReadsEveryScalar) {
  EXPECT_EQ(read(listOf("\x08")), Value(false));
  EXPECT_EQ(read(listOf("\x09")), Value(true));
  EXPECT_EQ(read(listOf("\x10\xFF")), Value(255));
  EXPECT_EQ(read(listOf("\x11\x01\x00"s)), Value(256));
  EXPECT_EQ(read(listOf("\x12\xFF\xFF\xFF\xFF")), Value(std::int64_t{4294967295}));
  EXPECT_EQ(read(listOf("\x13" + bigEndian(~0ULL, 8))), Value(-1));
  EXPECT_EQ(read(listOf("\x14" + bigEndian(0, 8) + bigEndian(~0ULL, 8))),
            Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_EQ(read(listOf("\x22\x3F\x80\x00\x00"s)), Value(1.0));
  EXPECT_EQ(read(listOf("\x23\xC0\x04\x00\x00\x00\x00\x00\x00"s)), Value(-2.5));
  EXPECT_EQ(read(listOf("\x33\x41\xB7\x97\x84\x00\x20\x00\x00"s)), Value(Date{978307200 + 395805696.125}));
  EXPECT_EQ(read(listOf("\x44\x00\x01\x00\xFF"s)), Value(Data("\x00\x01\x00\xFF"s)));
  EXPECT_EQ(read(listOf("\x40")), Value(Data()));
  EXPECT_EQ(read(listOf("\x53"
                        "abc")),
            Value("abc"));
  EXPECT_EQ(read(listOf("\x50")), Value(""));
  EXPECT_EQ(read(listOf("\x62\xD8\x3D\xDE\x00"s)), Value("😀"));
  EXPECT_EQ(read(listOf("\x80\x05")), Value(Dictionary{{"CF$UID", 5}}));
  EXPECT_EQ(read(listOf("\x5F\x10\x14" + std::string(20, 'x'))), Value(std::string(20, 'x')));
}

TEST(BinaryPropertyListTest, ReadsContainersWithSharedObjects) {
  BinaryListBuilder builder;
  builder.add(builder.container(0xD, 2, {1, 2, 3, 3}));
  builder.add(
      "\x51"
      "a");
  builder.add(
      "\x51"
      "b");
  builder.add(builder.array({1, 1, 4}));
  builder.add("\xD0");
  const Value shared = Array{"a", "a", Dictionary()};
  EXPECT_EQ(read(builder.list()), Value(Dictionary{{"a", shared}, {"b", shared}}));
}

TEST(BinaryPropertyListTest, ReadsKeysOfEveryEncoding) {
  BinaryListBuilder builder;
  builder.add(builder.container(0xD, 3, {1, 2, 3, 4, 4, 4}));
  builder.add("\x51\xFF");
  builder.add("\x62\x01\x00\xD8\x3D"s);
  builder.add("\x50");
  builder.add("\x09");
  EXPECT_EQ(read(builder.list()), Value(Dictionary{{"\uFFFD", true}, {"Ā", true}, {"", true}}));
}

TEST(BinaryPropertyListTest, KeepsNULInStringsAndReplacesWhatIsNoText) {
  EXPECT_EQ(read(listOf("\x63\x00\x61\x00\x00\x00\x62"s)), Value("a\0b"s));
  EXPECT_EQ(read(listOf("\x53"
                        "a\xFF"
                        "b")),
            Value("a\uFFFDb"));
  EXPECT_EQ(read(listOf("\x52\xC3\xA9")), Value("é"));
}

TEST(BinaryPropertyListTest, ADateOutsideTheCalendarIsAnError) {
  EXPECT_EQ(error(listOf("\x33\x7F\xF8\x00\x00\x00\x00\x00\x00"s)),
            "binary property list: holds a value that can't be read");
  EXPECT_EQ(error(listOf("\x33\x7F\xE0\x00\x00\x00\x00\x00\x00"s)),
            "binary property list: holds a value that can't be read");
}

TEST(BinaryPropertyListTest, RefusesCycles) {
  BinaryListBuilder direct;
  direct.add(direct.array({0}));
  EXPECT_EQ(error(direct.list()), "binary property list: object that contains itself");
  BinaryListBuilder wide;
  wide.add(wide.array({1, 2}));
  wide.add("\x09");
  wide.add(wide.container(0xD, 1, {3, 0}));
  wide.add("\x51k");
  EXPECT_EQ(error(wide.list()), "binary property list: object that contains itself");
}

TEST(BinaryPropertyListTest, ReadsNestingUpToItsBoundOnly) {
  const auto nested = [](std::size_t depth) {
    BinaryListBuilder builder;
    for (std::size_t i = 1; i < depth; ++i) builder.add(builder.array({i}));
    builder.add(builder.array({}));
    return builder.list();
  };
  EXPECT_TRUE(propertyListWithData(nested(kMaximumPropertyListDepth)).value);
  EXPECT_EQ(error(nested(kMaximumPropertyListDepth + 1)), "binary property list: nested too deep");
  EXPECT_EQ(error(nested(100'000)), "binary property list: nested too deep");
}

TEST(BinaryPropertyListTest, CountsNestingThroughObjectsMetBefore) {
  // The root first meets each half of a long chain near its end, then the whole of it.
  constexpr std::size_t kLength = 200;
  BinaryListBuilder builder;
  std::vector<std::uint64_t> references;
  for (std::size_t i = kLength; i >= 1; --i) references.push_back(i);
  builder.add(builder.array(references));
  for (std::size_t i = 1; i < kLength; ++i) builder.add(builder.array({i + 1}));
  builder.add(builder.array({}));
  EXPECT_EQ(error(builder.list()), "binary property list: nested too deep");
}

TEST(BinaryPropertyListTest, RefusesSharingThatMultiplies) {
  BinaryListBuilder doubling;
  for (std::size_t i = 0; i < 60; ++i) doubling.add(doubling.array({i + 1, i + 1}));
  doubling.add("\x09");
  EXPECT_EQ(error(doubling.list()),
            "binary property list: shared objects that take up far more than the list");
  BinaryListBuilder large;
  large.add(large.array(std::vector<std::uint64_t>(1000, 1)));
  large.add(BinaryListBuilder::start(4, 1 << 20) + std::string(1 << 20, 'x'));
  EXPECT_EQ(error(large.list()), "binary property list: shared objects that take up far more than the list");
}

TEST(BinaryPropertyListTest, ReadsTheSharingOfHonestLists) {
  BinaryListBuilder builder;
  constexpr std::size_t kRows = 1000;
  std::vector<std::uint64_t> rows;
  for (std::uint64_t i = 0; i < kRows; ++i) rows.push_back(3 + i);
  builder.add(builder.array(rows));
  builder.add(BinaryListBuilder::start(5, 100) + std::string(100, 'k'));
  builder.add(BinaryListBuilder::start(5, 300) + std::string(300, 'v'));
  for (std::size_t i = 0; i < kRows; ++i) builder.add(builder.container(0xD, 1, {1, 2}));
  EXPECT_EQ(read(builder.list()).array()->size(), kRows);
}

TEST(BinaryPropertyListTest, RefusesObjectsOverOneAnother) {
  // A thousand arrays of a thousand references, all of the same bytes.
  constexpr std::size_t kArrays = 1000;
  std::string bytes = "bplist00\xAF\x11" + bigEndian(kArrays, 2);
  for (std::size_t i = 0; i < kArrays; ++i) bytes += bigEndian(i, 2);
  const std::size_t table = bytes.size();
  for (std::size_t i = 0; i < kArrays; ++i) bytes += bigEndian(8, 2);
  bytes += "\0\0\0\0\0\0\2\2"s + bigEndian(kArrays, 8) + bigEndian(0, 8) + bigEndian(table, 8);
  EXPECT_FALSE(propertyListWithData(bytes).value);
}

TEST(BinaryPropertyListTest, RefusesReferencesAndKeysThatAreNone) {
  BinaryListBuilder beyond;
  beyond.add(beyond.array({7}));
  EXPECT_EQ(error(beyond.list()), "binary property list: reference to an object that does not exist");
  BinaryListBuilder key;
  key.add(key.container(0xD, 1, {1, 1}));
  key.add("\x09");
  EXPECT_EQ(error(key.list()), "binary property list: key that is no string or holds a NUL");
  for (const std::string& text : {"\x53"
                                  "a\0b"s,
                                  "\x50\x62\0a\0\0"s.substr(1)}) {
    BinaryListBuilder holdsNUL;
    holdsNUL.add(holdsNUL.container(0xD, 1, {1, 2}));
    holdsNUL.add(text);
    holdsNUL.add("\x09");
    EXPECT_EQ(error(holdsNUL.list()), "binary property list: key that is no string or holds a NUL");
  }
}

TEST(BinaryPropertyListTest, RefusesImpossibleCountsAndWidths) {
  EXPECT_EQ(error(listOf("\x5F\x13" + bigEndian(~0ULL, 8))), "binary property list: impossible count");
  EXPECT_EQ(error(listOf("\xAF\x13" + bigEndian(1ULL << 62, 8))), "binary property list: impossible count");
  EXPECT_EQ(error(listOf("\x5F\x23")), "binary property list: broken count");
  EXPECT_EQ(error(listOf("\x5F")), "binary property list: broken count");
  EXPECT_EQ(error(listOf("\x5E"
                         "abc")),
            "binary property list: object 0 is cut short");
  EXPECT_EQ(error(listOf("\xA3")), "binary property list: object 0 is cut short");
  EXPECT_EQ(error(listOf("\x15")), "binary property list: integer of unknown width");
  EXPECT_EQ(error(listOf("\x24")), "binary property list: real of unknown width");
  EXPECT_EQ(error(listOf("\x32")), "binary property list: date of unknown width");
  EXPECT_EQ(error(listOf("\x00"s)), "binary property list: unknown kind of object");
  EXPECT_EQ(error(listOf("\xB0")), "binary property list: unknown kind of object");
}

TEST(BinaryPropertyListTest, RefusesTrailersThatAreNone) {
  BinaryListBuilder builder;
  builder.add("\x09");
  const std::string good = builder.list();
  const std::size_t trailer = good.size() - 32;
  const auto changed = [&](std::size_t place, const std::string& bytes) {
    return error(std::string(good).replace(trailer + place, bytes.size(), bytes));
  };
  EXPECT_EQ(changed(6, "\0"s), "binary property list: impossible widths in the trailer");
  EXPECT_EQ(changed(7, "\x09"), "binary property list: impossible widths in the trailer");
  EXPECT_EQ(changed(8, bigEndian(~0ULL, 8)), "binary property list: offset table outside the list");
  EXPECT_EQ(changed(8, bigEndian(0, 8)), "binary property list: no root object");
  EXPECT_EQ(changed(16, bigEndian(1, 8)), "binary property list: no root object");
  EXPECT_EQ(changed(24, bigEndian(~0ULL, 8)), "binary property list: offset table outside the list");
  EXPECT_EQ(changed(24, bigEndian(0, 8)), "binary property list: offset table outside the list");
  EXPECT_EQ(error("bplist"), "binary property list: too short");
  EXPECT_EQ(error("bplist99" + good.substr(8)), "binary property list: unknown version");
}

}  // namespace
}  // namespace tallyd::platform
