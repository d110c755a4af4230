#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/dbus/BodyReader.h"
#include "platform/dbus/BodyWriter.h"
#include "platform/dbus/ByteWriter.h"

namespace tallyd::platform::dbus {
namespace {

using namespace std::string_literals;
using namespace std::string_view_literals;

std::string written(std::string_view signature, const std::vector<Value>& values,
                    std::size_t descriptors = 0) {
  std::string body;
  ByteWriter out(body);
  EXPECT_EQ(writeBody(out, signature, values, descriptors), std::nullopt);
  return body;
}

ReadValues readLittle(std::string_view body, std::string_view signature) {
  return readBody(body, std::endian::little, signature, {});
}

TEST(BodyTest, GoldenBytesOfAMessagesArguments) {
  constexpr auto kBody =
      "\4\0\0\0"            // category, type
      "\x20\0\0\0"          // array of dictionaries
      "\x18\0\0\0\0\0\0\0"  // a dictionary's entries, from a boundary of 8
      "\1\0\0\0k\0\1x\0\0\0\0\0\0\0\0"sv;
  const auto cut = readLittle(kBody.substr(0, kBody.size()), "qqaa{sv}");
  EXPECT_TRUE(cut.problem) << "the arrays reach beyond the body";

  const std::string whole =
      written("qqaa{sv}", {Value(4), Value(0), Value(Array{Value(Dictionary{{"k", Value(7)}})})});
  EXPECT_EQ(whole, "\4\0\0\0\x20\0\0\0\x18\0\0\0\0\0\0\0\1\0\0\0k\0\1x\0\0\0\0\0\0\0\0\7\0\0\0\0\0\0\0"sv);
  const auto read = readLittle(whole, "qqaa{sv}");
  EXPECT_EQ(read.problem, std::nullopt);
  EXPECT_EQ(read.values,
            (std::vector<Value>{Value(4), Value(0), Value(Array{Value(Dictionary{{"k", Value(7)}})})}));
}

TEST(BodyTest, ReadsBigEndianBodies) {
  const auto read = readBody("\0\0\0\5hello\0\0\0\0\0\0\0\0\0\0\0\0\0\0\7"sv, std::endian::big, "sx", {});
  EXPECT_EQ(read.problem, std::nullopt);
  EXPECT_EQ(read.values, (std::vector<Value>{Value("hello"), Value(7)}));
}

TEST(BodyTest, WhatIsWrittenReadsTheSame) {
  const std::vector<Value> values{
      Value("text"),
      Value(Array{Value(), Value(true), Value(-5), Value(std::uint64_t{1} << 63), Value(2.5),
                  Value(Date{1.25}), Value(Data("\0\1"s)), Value(Array{Value("ä"), Value(Array())}),
                  Value(Dictionary{{"a", Value(Dictionary())}, {"b", Value("c")}})})};
  const auto read = readBody(written("sav", values), std::endian::native, "sav", {});
  EXPECT_EQ(read.problem, std::nullopt);
  EXPECT_EQ(read.values, values);
}

TEST(BodyTest, EveryCutIsRefused) {
  const std::string whole =
      written("sa{sv}", {Value("text"), Value(Dictionary{{"k", Value(Array{Value("v")})}})});
  for (std::size_t size = 0; size < whole.size(); ++size)
    EXPECT_TRUE(readBody(std::string_view(whole).substr(0, size), std::endian::native, "sa{sv}", {}).problem)
        << size;
  EXPECT_EQ(readBody(whole + '\0', std::endian::native, "sa{sv}", {}).problem,
            "More follows than the arguments");
}

TEST(BodyTest, RefusesWhatIsNoValue) {
  EXPECT_EQ(readLittle("\2\0\0\0"sv, "b").problem, "Argument 1: a boolean that is neither 0 nor 1");
  EXPECT_EQ(readLittle("\1s\0\0\1\0\0\0x\0"sv, "v").values, std::vector<Value>{Value("x")});
  EXPECT_EQ(readLittle("\2ss\0"sv, "v").problem, "Argument 1: a variant of no single type");
  EXPECT_EQ(readLittle("\1z\0"sv, "v").problem, "Argument 1: a variant of no single type");
  EXPECT_EQ(readLittle("\1h\0\0\0\0\0\0"sv, "v").problem, "Argument 1: a descriptor is no value");
  EXPECT_EQ(readLittle("\1s\0"sv, "g").problem, "Argument 1: a signature is no value");
  EXPECT_EQ(readLittle("\1\0\0\4"sv, "ay").problem, "Argument 1: an array that is too long");
  EXPECT_EQ(readLittle("\3\0\0\0\1\0\2\0"sv, "aq").problem,
            "Argument 1: an element that reaches beyond its array");
}

TEST(BodyTest, NestingIsBoundedBothWays) {
  Value nested("bottom");
  for (int i = 0; i < kMaximumContainerDepth; ++i) nested = Value(Array{nested});
  std::string body;
  ByteWriter out(body);
  EXPECT_EQ(writeBody(out, "v", {nested}, 0), "nested too deeply");
  std::string deep;
  for (int i = 0; i < kMaximumContainerDepth; ++i) deep += "\1v\0"sv;
  EXPECT_EQ(readLittle(deep + std::string("\1y\0\5"sv), "v").problem, "Argument 1: nested too deeply");
  EXPECT_EQ(readLittle(deep.substr(3) + std::string("\1y\0\5"sv), "v").values, std::vector<Value>{Value(5)});
}

TEST(BodyTest, DescriptorsAreMovedOutOnce) {
  std::vector<FileDescriptor> came;
  came.emplace_back(::dup(0));
  came.emplace_back(::dup(0));
  const int second = came[1].get();
  auto read = readBody(written("ah", {Value(Array{Value()})}, 1), std::endian::native, "ah", std::move(came));
  ASSERT_EQ(read.descriptors.size(), 1U);
  EXPECT_NE(read.descriptors[0].get(), second);
  EXPECT_EQ(readLittle("\0\0\0\0"sv, "h").problem, "Argument 1: a descriptor that did not come");
}

TEST(BodyTest, ValuesThatDoNotFitAreNotWritten) {
  std::string body;
  ByteWriter out(body);
  EXPECT_EQ(writeBody(out, "q", {Value(70'000)}, 0), "the value does not fit the type \"q\"");
  EXPECT_EQ(writeBody(out, "s", {Value(1)}, 0), "the value does not fit the type \"s\"");
  EXPECT_EQ(writeBody(out, "t", {Value(-1)}, 0), "the value does not fit the type \"t\"");
  EXPECT_EQ(writeBody(out, "h", {Value()}, 0), "the value does not fit the type \"h\"");
  EXPECT_EQ(writeBody(out, "a{sv}", {Value(Array())}, 0), "the value does not fit the type \"a{sv}\"");
  EXPECT_EQ(writeBody(out, "s", {}, 0), "too few values");
  EXPECT_EQ(writeBody(out, "", {Value("x")}, 0), "too many values");
}

TEST(BodyTest, TextThatDBusCannotCarryGetsReplacementCharacters) {
  EXPECT_EQ(readBody(written("s", {Value(std::string("a\0\xFFz", 4))}), std::endian::native, "s", {}).values,
            std::vector<Value>{Value("a\uFFFD\uFFFDz")});
}

}  // namespace
}  // namespace tallyd::platform::dbus
