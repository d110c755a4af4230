#include "backends/TallyBackend.h"

#include <gtest/gtest.h>

#include <vector>

#include "fakes/FakePlatform.h"

namespace tallyd {
namespace {

using fakes::FakePlatform;
using platform::Dictionary;

/// A backend that only inherits.
class PlainBackend : public TallyBackend {
 public:
  explicit PlainBackend(const platform::Platform& platform, Payload profile = Dictionary(),
                        std::optional<std::string> productFamily = "Kasten")
      : TallyBackend(platform, "plain", std::move(profile), std::move(productFamily)) {}
  using TallyBackend::sendMessage;
};

/// A backend that keeps the numbers its messages got.
class CountingBackend : public PlainBackend {
 public:
  using PlainBackend::PlainBackend;
  using PlainBackend::sendMessage;
  Result sendMessage(const Payload&, const timeval&, std::uint16_t method, std::uint16_t respCode,
                     std::uint16_t number) override {
    numbers.push_back(number);
    return std::to_string(method) + "/" + std::to_string(respCode);
  }

  std::vector<std::uint16_t> numbers;
};

struct TallyBackendTest : testing::Test {
  FakePlatform fake;
  PlainBackend backend{fake.platform};
};

TEST_F(TallyBackendTest, StartsPendingWithEverythingElseEmpty) {
  EXPECT_EQ(backend.state(), ReportingStatePending);
  EXPECT_EQ(backend.name(), "plain");
  EXPECT_EQ(backend.productFamily(), "Kasten");
  EXPECT_EQ(backend.sessionID(), 0U);
  EXPECT_EQ(backend.combinedSessionIDString(), std::nullopt);
  EXPECT_EQ(backend.hierarchy(), 0);
  EXPECT_EQ(backend.compType(), 0);
  EXPECT_EQ(backend.clientVersion(), 0);
  EXPECT_EQ(backend.eventID(), 0);
  EXPECT_EQ(backend.selfVersionMajor(), 0);
  EXPECT_EQ(backend.selfVersionMinor(), 0);
  EXPECT_EQ(backend.startTimeStamp(), 0);
  EXPECT_EQ(backend.displayURL(), std::nullopt);
  EXPECT_EQ(backend.productVersion(), std::nullopt);
  EXPECT_EQ(backend.buildVersion(), std::nullopt);
  EXPECT_EQ(backend.hardwareType(), std::nullopt);
  EXPECT_EQ(backend.userInfoDict(), std::nullopt);
  EXPECT_FALSE(backend.isInternal());
  EXPECT_FALSE(backend.requireUserInfo());
  EXPECT_FALSE(backend.batchEvents());
}

TEST_F(TallyBackendTest, GivesBackWhatItsSettersTook) {
  backend.setState(ReportingStateOff);
  backend.setSessionID(4'294'967'295U);
  backend.setCombinedSessionIDString("combined");
  backend.setHierarchy(-3);
  backend.setCompType(11);
  backend.setClientVersion(65'535);
  backend.setUdid("device");
  backend.setProductVersion("12.4");
  backend.setBuildVersion("12D500");
  backend.setHardwareType("Kasten3,1");
  backend.setUserInfoDict(Dictionary{{"k", 1}});
  backend.setIsInternal(true);
  backend.setRequireUserInfo(true);
  backend.setBatchEvents(true);
  backend.setSamplingFactor(0.75);
  EXPECT_EQ(backend.state(), ReportingStateOff);
  EXPECT_EQ(backend.sessionID(), 4'294'967'295U);
  EXPECT_EQ(backend.combinedSessionIDString(), "combined");
  EXPECT_EQ(backend.hierarchy(), -3);
  EXPECT_EQ(backend.compType(), 11);
  EXPECT_EQ(backend.clientVersion(), 65'535);
  EXPECT_STREQ(backend.udid(), "device");
  EXPECT_EQ(backend.productVersion(), "12.4");
  EXPECT_EQ(backend.buildVersion(), "12D500");
  EXPECT_EQ(backend.hardwareType(), "Kasten3,1");
  EXPECT_EQ(backend.userInfoDict(), (Dictionary{{"k", 1}}));
  EXPECT_TRUE(backend.isInternal());
  EXPECT_TRUE(backend.requireUserInfo());
  EXPECT_TRUE(backend.batchEvents());
  EXPECT_EQ(backend.samplingFactor(), 0.75);
}

TEST_F(TallyBackendTest, DrawsItsSamplingFactorOnceEach) {
  fake.randomness.draws = {0.125, 0.875};
  const PlainBackend first(fake.platform);
  const PlainBackend second(fake.platform);
  EXPECT_EQ(first.samplingFactor(), 0.125);
  EXPECT_EQ(second.samplingFactor(), 0.875);
}

TEST_F(TallyBackendTest, IsOnOnceItsStateIsUpdated) {
  backend.setState(ReportingStateOff);
  backend.updateState();
  EXPECT_EQ(backend.state(), ReportingStateOn);
}

TEST_F(TallyBackendTest, DoesNothingUntilAKindOverridesIt) {
  EXPECT_EQ(backend.sendMessage(Dictionary{{"k", "v"}}, {1, 2}, 3, 4, 5), std::nullopt);
  EXPECT_EQ(backend.sendMessage(std::nullopt, {1, 2}, 3, 4), std::nullopt);
  EXPECT_EQ(backend.flushMessages(), std::nullopt);
  EXPECT_FALSE(backend.uploadFileAtPath("/tmp/file", "token"));
  EXPECT_FALSE(backend.uploadLogData(platform::Array{1, 2}));
  backend.cleanup();
  EXPECT_EQ(backend.state(), ReportingStatePending);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(TallyBackendTest, TakesACorrelatedSessionIDAsTheCombinedOne) {
  backend.setCorrelatedSessionID("parent.child");
  EXPECT_EQ(backend.combinedSessionIDString(), "parent.child");
}

TEST_F(TallyBackendTest, KeepsItsStartTimeInSecondsWithTheMicrosecondsAsFraction) {
  backend.setStartTimestamp({1'768'478'459, 500'000});
  EXPECT_DOUBLE_EQ(backend.startTimeStamp(), 1'768'478'459.5);
  backend.setStartTimestamp({-2, 250'000});
  EXPECT_DOUBLE_EQ(backend.startTimeStamp(), -1.75);
}

TEST(TallyBackendEventIDTest, NumbersTheFirstEventOneAndComesBackToZeroAfter65536) {
  FakePlatform fake;
  CountingBackend backend(fake.platform);
  for (int i = 0; i < 65'537; ++i) backend.sendMessage(std::nullopt, {0, 0}, 1, 2);
  ASSERT_EQ(backend.numbers.size(), 65'537U);
  EXPECT_EQ(backend.numbers.front(), 1);
  EXPECT_EQ(backend.numbers[65'534], 65'535);
  EXPECT_EQ(backend.numbers[65'535], 0);
  EXPECT_EQ(backend.numbers[65'536], 1);
  EXPECT_EQ(backend.eventID(), 1);
}

TEST(TallyBackendEventIDTest, CountsEachBackendForItself) {
  FakePlatform fake;
  CountingBackend first(fake.platform);
  CountingBackend second(fake.platform);
  first.sendMessage(std::nullopt, {0, 0}, 1, 2);
  first.sendMessage(std::nullopt, {0, 0}, 1, 2);
  EXPECT_EQ(second.sendMessage(std::nullopt, {0, 0}, 65'535, 7), "65535/7");
  EXPECT_EQ(first.numbers, (std::vector<std::uint16_t>{1, 2}));
  EXPECT_EQ(second.numbers, (std::vector<std::uint16_t>{1}));
}

struct VersionCase {
  const char* text;
  int major;
  int minor;
};

TEST_F(TallyBackendTest, ReadsTheFirstTwoPartsOfItsVersionAndCutsEachTo8Bits) {
  for (const VersionCase& expected : std::initializer_list<VersionCase>{{"7", 7, 0},
                                                                        {"6.21.3", 6, 21},
                                                                        {"300.1", 44, 1},
                                                                        {"1.257", 1, 1},
                                                                        {"", 0, 0},
                                                                        {".", 0, 0},
                                                                        {".5", 0, 5},
                                                                        {"5.", 5, 0},
                                                                        {"beta.rc", 0, 0},
                                                                        {"3x.4y", 3, 4},
                                                                        {"8..9", 8, 0},
                                                                        {"-1.-1", 255, 255}}) {
    backend.setSelfVersion("9.9");
    backend.setSelfVersion(expected.text);
    EXPECT_EQ(backend.selfVersionMajor(), expected.major) << '"' << expected.text << '"';
    EXPECT_EQ(backend.selfVersionMinor(), expected.minor) << '"' << expected.text << '"';
  }
}

TEST(ConvertIntoSHA256Test, GivesTheStandardTestDigestInLowerCaseHexadecimal) {
  EXPECT_EQ(TallyBackend::convertIntoSHA256("abc"),
            "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(TallyBackend::convertIntoSHA256(""),
            "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
  EXPECT_EQ(TallyBackend::convertIntoSHA256(std::string(1000, 'x')),
            "44f8354494a5ba03ba1792a8d3e9c534c47a9181980fde7a3f44b06ef2ae7c7f");
}

// The digests are those of a command-line tool over the bytes that the comment names.
TEST(ConvertIntoSHA256Test, HashesAsManyBytesAsTheTextHasUTF16Units) {
  const std::pair<const char*, const char*> digests[] = {
      // 13 of 15 bytes.
      {"Jürgen Müller", "7976cb0f3a5fc563757e5d2bd1d8079367aae31c8a47992a88f70cc3f7dc04f3"},
      // 1 of 2 bytes: C3.
      {"é", "ae3f4619b0413d70d3004b9131c3752153074e45725be13b9a148978895e359e"},
      // 2 of 3 bytes: e and a combining acute accent, cut behind CC.
      {"e\u0301", "c0f401e3c29287731a5dfe3fd5c3f79eceeeec95a4c31a3bea6e0c946610c56a"},
      // 3 of 9 bytes: the first letter alone.
      {"東京都", "469e009b15a00cf1b308259866d5855699e71385d383faf289db85597db28f83"},
      // 2 of 4 bytes: a surrogate pair counts twice.
      {"😀", "3c1c36c746e9b9106e77cfc2ede3374d38a883e23fbcd3b20023e326008c5434"},
      // 4 of 6 bytes.
      {"a😀b", "39eb6d1633e9ded300c3de9ca52d43011d7f0551d7c69256a3426527156865fb"},
      // 8 of 18 bytes: three emoji and two joiners.
      {"👩‍👩‍👧", "c42a13684eb1a8668a7bbc5c5acb89653880aa279ed6dc5f0b3cd782acc28775"},
  };
  for (const auto& [text, digest] : digests) EXPECT_EQ(TallyBackend::convertIntoSHA256(text), digest) << text;
}

TEST(ConvertIntoSHA256Test, NeverReadsBehindTextThatIsNotWellFormed) {
  EXPECT_EQ(TallyBackend::convertIntoSHA256("\xff\xfe\xc3").size(), 64U);
  EXPECT_EQ(TallyBackend::convertIntoSHA256(std::string_view("a\0b", 3)).size(), 64U);
  EXPECT_NE(TallyBackend::convertIntoSHA256(std::string_view("a\0b", 3)),
            TallyBackend::convertIntoSHA256("a"));
}

TEST(CodeForClientTypeTest, KnowsTheTwelveClientTypesAndGivesNothingForOthers) {
  const std::vector<std::string_view> codes{"KP", "WD", "YBF", "HJ", "ZU", "PH",
                                            "VT", "DH", "LB",  "BW", "HT", "FN"};
  for (std::size_t i = 0; i < codes.size(); ++i) {
    EXPECT_EQ(codeForClientType(static_cast<std::int32_t>(i)), codes[i]);
  }
  for (const std::int32_t other : {-1, 12, 2'147'483'647, -2'147'483'647 - 1}) {
    EXPECT_EQ(codeForClientType(other), "") << other;
  }
}

}  // namespace
}  // namespace tallyd
