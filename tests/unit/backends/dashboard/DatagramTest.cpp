#include "backends/dashboard/Datagram.h"

#include <gtest/gtest.h>

#include <string>

namespace tallyd {
namespace {

using namespace std::string_literals;
using platform::Dictionary;

const DatagramFacts kFacts{.selfVersionMajor = 7,
                           .compType = 6,
                           .timestamp = {0x01020304, 999'999},
                           .sessionID = 0x0A0B0C0D,
                           .clientVersion = 0x0102,
                           .method = 0x1122,
                           .respCode = 0x3344,
                           .udid = "0123456789abcdef0123456789abcdef01234567",
                           .eventID = 0x5566,
                           .reliableUDP = false,
                           .usingProfile = true};

std::string headerFor(const DatagramFacts& facts) {
  return std::string(Datagram(facts, Dictionary()).bytes());
}

TEST(DatagramTest, IsTheseBytes) {
  EXPECT_EQ(Datagram(kFacts, Dictionary{{"b", "xyz"}, {"a", 7}}).bytes(),
            "\x07\x06\x01\xF9"                          // Version, client type, constant, 249 steps of 4 ms.
            "\x01\x02\x03\x04"                          // Seconds.
            "\xF5\xF4\xF3\xF2"                          // Session ID, inverted.
            "\xFE\xFD"                                  // Client version, inverted.
            "\xFF\xB5"                                  // Length 74, inverted.
            "\x11\x22\x33\x44"                          // Method, response code.
            "0123456789abcdef0123456789abcdef01234567"  // Device.
            "\x55\x66\x00\x00"                          // Event ID, flags.
            " a=7 b=xyz"s);
}

TEST(DatagramTest, IsAHeaderAloneForAnEmptyPayloadAndForNone) {
  for (const std::optional<Dictionary>& payload :
       {std::optional<Dictionary>(), std::optional(Dictionary())}) {
    const Datagram datagram(kFacts, payload);
    EXPECT_EQ(datagram.bytes().size(), 64U);
    EXPECT_EQ(datagramNumber16(datagram.bytes(), DatagramLength), 0xFFBF);
  }
}

TEST(DatagramTest, HoldsAtMost1023BytesOfText) {
  const Datagram datagram(kFacts, Dictionary{{"k", std::string(5000, 'x')}});
  EXPECT_EQ(datagram.bytes().size(), 1087U);
  EXPECT_EQ(datagramNumber16(datagram.bytes(), DatagramLength), static_cast<std::uint16_t>(~1087));
  EXPECT_EQ(datagram.bytes().substr(DatagramText), " k=" + std::string(1020, 'x'));
}

TEST(DatagramTest, FitsTheTextThatIsJustLongEnough) {
  const Datagram full(kFacts, Dictionary{{"k", std::string(1020, 'x')}});
  EXPECT_EQ(full.bytes().size(), 1087U);
  EXPECT_EQ(Datagram(kFacts, Dictionary{{"k", std::string(1021, 'x')}}).bytes(), full.bytes());
  EXPECT_EQ(Datagram(kFacts, Dictionary{{"k", std::string(1019, 'x')}}).bytes().size(), 1086U);
}

TEST(DatagramTest, CountsTheTimeInStepsOfFourMilliseconds) {
  const auto subsecond = [](std::int32_t microseconds) {
    DatagramFacts facts = kFacts;
    facts.timestamp = {12, microseconds};
    return datagramByte(headerFor(facts), DatagramSubsecond);
  };
  EXPECT_EQ(subsecond(999'999), 249);
  EXPECT_EQ(subsecond(996'000), 249);
  EXPECT_EQ(subsecond(995'999), 248);
  EXPECT_EQ(subsecond(4000), 1);
  EXPECT_EQ(subsecond(3999), 0);
  DatagramFacts facts = kFacts;
  facts.timestamp = {12, 999'999};
  EXPECT_EQ(headerFor(facts).substr(DatagramSubsecond, 5), "\xF9\x00\x00\x00\x0C"s);
}

TEST(DatagramTest, TakesTheLowBitsOfWhatIsWider) {
  DatagramFacts facts = kFacts;
  facts.compType = 0x1234;
  facts.timestamp = {0x1'0203'0405, 0};
  EXPECT_EQ(datagramByte(headerFor(facts), DatagramClientType), 0x34);
  EXPECT_EQ(datagramNumber32(headerFor(facts), DatagramSeconds), 0x02030405U);
}

TEST(DatagramTest, SetsOneFlagForEachOfTwoFacts) {
  const auto flags = [](bool reliable, bool profile) {
    DatagramFacts facts = kFacts;
    facts.reliableUDP = reliable;
    facts.usingProfile = profile;
    return datagramNumber16(headerFor(facts), DatagramFlags);
  };
  EXPECT_EQ(flags(false, true), 0);
  EXPECT_EQ(flags(true, true), 1);
  EXPECT_EQ(flags(false, false), 2);
  EXPECT_EQ(flags(true, false), 3);
}

TEST(DatagramTest, SendsFortyBytesOfTheDeviceWhateverItsLength) {
  DatagramFacts facts = kFacts;
  facts.udid = "short";
  EXPECT_EQ(headerFor(facts).substr(DatagramDeviceID, 40), "short" + std::string(35, '\0'));
  facts.udid = "";
  EXPECT_EQ(headerFor(facts).substr(DatagramDeviceID, 40), std::string(40, '\0'));
  const std::string longer(45, 'd');
  facts.udid = longer;
  EXPECT_EQ(headerFor(facts).substr(DatagramDeviceID, 42), std::string(40, 'd') + "\x55\x66");
}

TEST(DatagramTest, AcknowledgesTheEventWhoseDatagramIsEchoed) {
  const Datagram datagram(kFacts, Dictionary{{"a", 1}});
  EXPECT_EQ(datagram.eventID(), 0x5566);
  EXPECT_EQ(acknowledgedEventID(datagram.bytes()), 0x5566);
  EXPECT_EQ(acknowledgedEventID(datagram.bytes().substr(0, 62)), 0x5566);
}

TEST(DatagramTest, AcknowledgesNothingInLessThan62Bytes) {
  const Datagram datagram(kFacts, std::nullopt);
  for (std::size_t length = 0; length < 62; ++length) {
    EXPECT_EQ(acknowledgedEventID(datagram.bytes().substr(0, length)), std::nullopt) << length;
  }
}

}  // namespace
}  // namespace tallyd
