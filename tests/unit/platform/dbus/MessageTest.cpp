#include "platform/dbus/Message.h"

#include <gtest/gtest.h>

#include "platform/dbus/ByteReader.h"

namespace tallyd::platform::dbus {
namespace {

using namespace std::string_view_literals;

std::string built(const MessageFields& fields, std::string_view text = {}) {
  std::string bytes;
  MessageBuilder message(bytes, fields);
  if (!text.empty()) message.body().text(text);
  message.finish();
  return bytes;
}

MessageFields call() {
  return {.type = MessageType::MethodCall,
          .serial = 7,
          .path = "/com/example",
          .interface = "com.example.Test",
          .member = "Echo",
          .signature = "s"};
}

TEST(MessageTest, GoldenBytesOfAnAnswer) {
  EXPECT_EQ(built({.type = MessageType::MethodReturn,
                   .flags = NoReplyExpected,
                   .serial = 3,
                   .replySerial = 9,
                   .signature = "s"},
                  "ok"),
            "l\2\1\1\7\0\0\0\3\0\0\0\xF\0\0\0"
            "\5\1u\0\x9\0\0\0"
            "\x8\1g\0\1s\0\0"
            "\2\0\0\0ok\0"sv);
}

TEST(MessageTest, WhatIsBuiltParsesTheSame) {
  const std::string bytes = built(call(), "text");
  EXPECT_EQ(messageLength(bytes), bytes.size());
  const Message message = parseMessage(bytes);
  EXPECT_EQ(message.fields.type, MessageType::MethodCall);
  EXPECT_EQ(message.fields.serial, 7U);
  EXPECT_EQ(message.fields.path, "/com/example");
  EXPECT_EQ(message.fields.interface, "com.example.Test");
  EXPECT_EQ(message.fields.member, "Echo");
  EXPECT_EQ(message.fields.signature, "s");
  EXPECT_TRUE(message.fields.expectsReply());
  EXPECT_EQ(message.body, "\4\0\0\0text\0"sv);
}

TEST(MessageTest, SeveralMessagesFollowEachOtherInOneText) {
  std::string bytes = built(call(), "a");
  const std::size_t first = bytes.size();
  MessageBuilder second(bytes, call());
  second.body().text("b");
  second.finish();
  EXPECT_EQ(messageLength(bytes), first);
  EXPECT_EQ(messageLength(std::string_view(bytes).substr(first)), bytes.size() - first);
  EXPECT_EQ(parseMessage(std::string_view(bytes).substr(first)).body, "\1\0\0\0b\0"sv);
}

TEST(MessageTest, TheLengthIsUnknownUntilTheFixedHeaderIsThere) {
  const std::string bytes = built(call(), "text");
  for (std::size_t size = 0; size < kFixedHeaderBytes; ++size)
    EXPECT_EQ(messageLength(std::string_view(bytes).substr(0, size)), 0U) << size;
}

TEST(MessageTest, AForeignByteOrderIsRefusedAtItsFirstByte) {
  EXPECT_THROW((void)messageLength("G"), Malformed);
}

TEST(MessageTest, RefusesFixedHeadersThatAreNone) {
  const auto refused = [](std::size_t place, char byte) {
    std::string bytes = built(call(), "text");
    bytes[place] = byte;
    try {
      (void)messageLength(bytes);
      return false;
    } catch (const Malformed&) {
      return true;
    }
  };
  EXPECT_TRUE(refused(1, 0)) << "type";
  EXPECT_TRUE(refused(3, 2)) << "version";
  EXPECT_TRUE(refused(8, 0)) << "serial";
  EXPECT_TRUE(refused(7, '\x10')) << "length of the body";
  EXPECT_TRUE(refused(15, '\x10')) << "length of the fields";
}

TEST(MessageTest, RefusesNamesThatAreNone) {
  const auto refused = [](auto change) {
    MessageFields fields = call();
    change(fields);
    const std::string bytes = built(fields, "text");
    try {
      (void)parseMessage(bytes);
      return false;
    } catch (const Malformed&) {
      return true;
    }
  };
  for (const char* path : {"x", "//", "/a/", "/a//b", "/a-b"})
    EXPECT_TRUE(refused([&](MessageFields& fields) { fields.path = path; })) << path;
  for (const char* name : {"single", ".a.b", "a..b", "a.b.", "a.1b", "a.b-c"})
    EXPECT_TRUE(refused([&](MessageFields& fields) { fields.interface = name; })) << name;
  for (const char* member : {"1a", "a.b", "a-b"})
    EXPECT_TRUE(refused([&](MessageFields& fields) { fields.member = member; })) << member;
  EXPECT_TRUE(refused([](MessageFields& fields) { fields.signature = "a"; }));
  EXPECT_FALSE(refused([](MessageFields& fields) { fields.path = "/"; }));
  EXPECT_FALSE(refused([](MessageFields& fields) { fields.interface = {}; }));
}

TEST(MessageTest, RefusesMessagesThatLackWhatTheirTypeMustHave) {
  const auto refused = [](MessageFields fields) {
    const std::string bytes = built(fields);
    EXPECT_THROW((void)parseMessage(bytes), Malformed);
  };
  refused({.type = MessageType::MethodCall, .serial = 1, .member = "Echo"});
  refused({.type = MessageType::MethodCall, .serial = 1, .path = "/a"});
  refused({.type = MessageType::Signal, .serial = 1, .path = "/a", .member = "Changed"});
  refused({.type = MessageType::MethodReturn, .serial = 1});
  refused({.type = MessageType::Error, .serial = 1, .replySerial = 2});
}

TEST(MessageTest, AFlaggedCallExpectsNoReply) {
  MessageFields fields = call();
  fields.flags = NoReplyExpected;
  EXPECT_FALSE(fields.expectsReply());
  EXPECT_FALSE((MessageFields{.type = MessageType::Signal}).expectsReply());
}

}  // namespace
}  // namespace tallyd::platform::dbus
