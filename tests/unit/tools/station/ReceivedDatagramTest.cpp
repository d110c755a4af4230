#include "station/ReceivedDatagram.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backends/dashboard/Datagram.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using testing::HasSubstr;

namespace {

constexpr const char* kDevice = "0123456789abcdef0123456789abcdef01234567";

const DatagramFacts kFacts{.selfVersionMajor = 6,
                           .compType = 5,
                           .timestamp = {1'772'366'401, 999'999},
                           .sessionID = 0x12345678,
                           .clientVersion = 0x0102,
                           .method = 0x0304,
                           .respCode = 0x0506,
                           .udid = kDevice,
                           .eventID = 0x0708,
                           .reliableUDP = true,
                           .usingProfile = true};

std::string sent(const DatagramFacts& facts, const Dictionary& payload = {}) {
  return std::string(tallyd::Datagram(facts, payload).bytes());
}

/// The payload that a receiver reads from what the daemon sends.
Dictionary received(const Dictionary& payload) {
  return fieldsOfText(decodeDatagram(sent(kFacts, payload)).datagram.value().text);
}

}  // namespace

TEST(ReceivedDatagramTest, ReadsTheBytesOfTheFormat) {
  std::string bytes =
      "\x06\x05\x01\x05"
      "\x69\xa4\x2b\x81"
      "\xed\xcb\xa9\x87"
      "\xfe\xfd"
      "\xff\xbb"
      "\x03\x04\x05\x06";
  bytes += kDevice;
  bytes += std::string("\x07\x08\x00\x03", 4) + " a=7";
  const DatagramResult result = decodeDatagram(bytes);
  ASSERT_TRUE(result.datagram) << result.problem;
  EXPECT_EQ(result.datagram->selfVersion, 6);
  EXPECT_EQ(result.datagram->clientType, 5);
  EXPECT_DOUBLE_EQ(result.datagram->sentTime, 1'772'366'721 + 0.020);
  EXPECT_EQ(result.datagram->session, 0x12345678U);
  EXPECT_EQ(result.datagram->clientVersion, 0x0102);
  EXPECT_EQ(result.datagram->method, 0x0304);
  EXPECT_EQ(result.datagram->status, 0x0506);
  EXPECT_EQ(result.datagram->device, kDevice);
  EXPECT_EQ(result.datagram->eventNumber, 0x0708);
  EXPECT_TRUE(result.datagram->isReliable);
  EXPECT_TRUE(result.datagram->hasNoProfile);
  EXPECT_EQ(result.datagram->text, " a=7");
}

TEST(ReceivedDatagramTest, ReadsWhatTheDaemonSends) {
  const DatagramResult result = decodeDatagram(sent(kFacts, {{"a", 7}}));
  ASSERT_TRUE(result.datagram) << result.problem;
  EXPECT_EQ(result.datagram->selfVersion, kFacts.selfVersionMajor);
  EXPECT_EQ(result.datagram->clientType, kFacts.compType);
  EXPECT_DOUBLE_EQ(result.datagram->sentTime, 1'772'366'401.996);
  EXPECT_EQ(result.datagram->session, kFacts.sessionID);
  EXPECT_EQ(result.datagram->clientVersion, kFacts.clientVersion);
  EXPECT_EQ(result.datagram->method, kFacts.method);
  EXPECT_EQ(result.datagram->status, kFacts.respCode);
  EXPECT_EQ(result.datagram->device, kDevice);
  EXPECT_EQ(result.datagram->eventNumber, kFacts.eventID);
  EXPECT_TRUE(result.datagram->isReliable);
  EXPECT_FALSE(result.datagram->hasNoProfile);

  DatagramFacts others = kFacts;
  others.udid = "short";
  others.reliableUDP = false;
  others.usingProfile = false;
  const auto other = decodeDatagram(sent(others)).datagram;
  ASSERT_TRUE(other);
  EXPECT_EQ(other->device, "short");
  EXPECT_FALSE(other->isReliable);
  EXPECT_TRUE(other->hasNoProfile);
  EXPECT_EQ(other->text, "");
}

TEST(ReceivedDatagramTest, MakesAnAcknowledgementThatTheDaemonUnderstands) {
  const std::string bytes = sent(kFacts, {{"a", 7}});
  EXPECT_EQ(acknowledgedEventID(acknowledgementOf(bytes)), kFacts.eventID);
}

TEST(ReceivedDatagramTest, SaysWhatIsWrong) {
  std::string bytes = sent(kFacts, {{"a", 7}});
  EXPECT_THAT(decodeDatagram("").problem, HasSubstr("0 bytes only"));
  EXPECT_THAT(decodeDatagram(bytes.substr(0, 63)).problem, HasSubstr("63 bytes only"));
  EXPECT_THAT(decodeDatagram(bytes + "x").problem, HasSubstr("69 bytes, and says that it has 68"));
  bytes[2] = 2;
  EXPECT_THAT(decodeDatagram(bytes).problem, HasSubstr("layout is 2"));
}

TEST(ReceivedDatagramTest, UndoesTheEscapesOfTheText) {
  const Dictionary payload{{"a", "x=y\\"},     {"b", "two words"}, {"c", "\\\\=="}, {"d", "k=v l=w"},
                           {"e", "trailing "}, {"f", " leading"},  {"number", 5},   {"flag", true}};
  EXPECT_EQ(received(payload), (Dictionary{{"a", "x=y\\"},
                                           {"b", "two words"},
                                           {"c", "\\\\=="},
                                           {"d", "k=v l=w"},
                                           {"e", "trailing "},
                                           {"f", " leading"},
                                           {"number", "5"},
                                           {"flag", "1"}}));
  EXPECT_EQ(received({{"none", ""}, {"list", Array{1}}, {"lines", "a\nb"}}),
            (Dictionary{{"none", "empty"}, {"list", "null"}, {"lines", "ab"}}));
}

TEST(ReceivedDatagramTest, ReadsOddTextsAsFarAsTheyGo) {
  EXPECT_EQ(fieldsOfText(""), Dictionary());
  EXPECT_EQ(fieldsOfText(" no sign"), Dictionary());
  EXPECT_EQ(fieldsOfText(" a="), (Dictionary{{"a", ""}}));
  EXPECT_EQ(fieldsOfText(" =x"), (Dictionary{{"", "x"}}));
  EXPECT_EQ(fieldsOfText("a=b"), (Dictionary{{"a", "b"}}));
  EXPECT_EQ(fieldsOfText(" a=b=c"), (Dictionary{{"a", "b=c"}}));
  EXPECT_EQ(fieldsOfText(" a=b\\"), (Dictionary{{"a", "b\\"}}));
  EXPECT_EQ(fieldsOfText(" two words=x"), (Dictionary{{"words", "x"}}));
}

TEST(ReceivedDatagramTest, KnowsATextThatMayBeCut) {
  EXPECT_FALSE(mayBeCut(decodeDatagram(sent(kFacts, {{"a", std::string(1019, 'x')}})).datagram.value().text));
  EXPECT_TRUE(mayBeCut(decodeDatagram(sent(kFacts, {{"a", std::string(2000, 'x')}})).datagram.value().text));
}

TEST(ReceivedDatagramTest, NamesSenders) {
  EXPECT_EQ(senderNamed(5), "PH");
  EXPECT_EQ(senderNamed(11), "FN");
  EXPECT_EQ(senderNamed(12), "12");
}

}  // namespace tallyd::station
