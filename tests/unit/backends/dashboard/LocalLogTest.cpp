#include "backends/dashboard/LocalLog.h"

#include <gtest/gtest.h>

#include "backends/dashboard/Datagram.h"
#include "platform/UTF8.h"

namespace tallyd {
namespace {

using platform::Dictionary;

const std::string kDevice = "0123456789abcdef0123456789abcdef01234567";

DatagramFacts facts() {
  return {.compType = 6,
          .timestamp = {1000, 20'000},
          .sessionID = 77,
          .clientVersion = 3,
          .method = 1,
          .respCode = 0,
          .udid = kDevice,
          .eventID = 12};
}

std::string lineFor(const DatagramFacts& facts, const Dictionary& payload = {{"a", 7}}) {
  return writeLocalLog(Datagram(facts, payload).bytes());
}

TEST(LocalLogTest, ReadsTheLineOutOfTheDatagram) {
  EXPECT_EQ(datagramByte(Datagram(facts(), std::nullopt).bytes(), DatagramSubsecond), 5);
  EXPECT_EQ(lineFor(facts()), "1000.020 " + kDevice + " 127.0.0.1 VT     3    77    12     1     0  a=7");
}

TEST(LocalLogTest, CutsTheTimeToFourMilliseconds) {
  DatagramFacts late = facts();
  late.timestamp.tv_usec = 999'999;
  EXPECT_TRUE(lineFor(late).starts_with("1000.996 "));
  late.timestamp.tv_usec = 3999;
  EXPECT_TRUE(lineFor(late).starts_with("1000.000 "));
}

TEST(LocalLogTest, GivesLargeNumbersTheRoomTheyNeed) {
  DatagramFacts large = facts();
  large.timestamp.tv_sec = 0xFFFFFFFF;
  large.clientVersion = 0xFFFF;
  large.sessionID = 0xFFFFFFFF;
  large.eventID = 0xFFFE;
  large.method = 0x8000;
  large.respCode = 12345;
  EXPECT_EQ(lineFor(large),
            "4294967295.020 " + kDevice + " 127.0.0.1 VT 65535 4294967295 65534 32768 12345  a=7");
}

TEST(LocalLogTest, NamesEveryClientType) {
  const std::vector<std::string> codes{"KP", "WD", "YBF", "HJ", "ZU", "PH",
                                       "VT", "DH", "LB",  "BW", "HT", "FN"};
  for (std::size_t type = 0; type < codes.size(); ++type) {
    DatagramFacts one = facts();
    one.compType = static_cast<std::int32_t>(type);
    EXPECT_EQ(lineFor(one),
              "1000.020 " + kDevice + " 127.0.0.1 " + codes[type] + "     3    77    12     1     0  a=7");
  }
}

TEST(LocalLogTest, NamesNoOtherClientType) {
  for (const std::int32_t type : {12, 255, -1}) {
    DatagramFacts one = facts();
    one.compType = type;
    EXPECT_EQ(lineFor(one), "1000.020 " + kDevice + " 127.0.0.1      3    77    12     1     0  a=7") << type;
  }
}

TEST(LocalLogTest, EndsAfterTheNumbersAndASpaceWithoutText) {
  EXPECT_TRUE(lineFor(facts(), {}).ends_with(" 12     1     0 "));
}

TEST(LocalLogTest, TakesADeviceIdentifierThatIsShorter) {
  DatagramFacts one = facts();
  one.udid = "short";
  EXPECT_TRUE(lineFor(one).starts_with("1000.020 short 127.0.0.1 VT "));
}

TEST(LocalLogTest, ReplacesALetterThatTheDatagramsEndCuts) {
  const Datagram datagram(facts(), Dictionary{{"k", std::string(1018, 'x') + "😀"}});
  EXPECT_TRUE(datagram.bytes().ends_with("x\xF0\x9F"));
  EXPECT_TRUE(writeLocalLog(datagram.bytes()).ends_with("x\xEF\xBF\xBD"));
}

TEST(LocalLogTest, IsAtMost1151BytesLong) {
  const std::string datagram = std::string(Datagram(facts(), std::nullopt).bytes()) + std::string(2000, 'x');
  EXPECT_EQ(writeLocalLog(datagram).size(), 1151U);
  // The line of a device whose ID is UTF-8 is shorter.
  EXPECT_LT(lineFor(facts(), {{"k", std::string(2000, 'x')}}).size(), 1151U);
}

TEST(LocalLogTest, IsAtMost1151BytesLongThoughReplacingMakesItLonger) {
  DatagramFacts one = facts();
  const std::string broken(kDatagramDeviceIDBytes, '\xFF');
  one.udid = broken;
  std::string replaced;
  for (std::size_t i = 0; i < broken.size(); ++i) replaced += platform::kReplacementCharacter;
  const std::string line = lineFor(one, {{"k", std::string(2000, 'x')}});
  EXPECT_EQ(line.size(), 1151U);
  EXPECT_TRUE(line.starts_with("1000.020 " + replaced + " 127.0.0.1 VT "));
  EXPECT_TRUE(line.ends_with("xx"));
}

TEST(LocalLogTest, LeavesOutALetterThatDoesNotFitWhole) {
  const std::string start(Datagram(facts(), std::nullopt).bytes());
  const std::size_t room = 1151 - writeLocalLog(start).size();
  for (std::size_t cut = 1; cut < 4; ++cut) {
    const std::string text(room - cut, 'x');
    EXPECT_EQ(writeLocalLog(start + text + "😀"), writeLocalLog(start + text)) << cut;
  }
  const std::string text(room - 4, 'x');
  EXPECT_TRUE(writeLocalLog(start + text + "😀y").ends_with("x😀"));
}

}  // namespace
}  // namespace tallyd
