// Adaptor bundles in the sandboxed daemon.

#include <gtest/gtest.h>

#include <sstream>

#include "adaptors/SampleAdaptors.h"
#include "integration/TestDaemon.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;
using platform::Value;

class AdaptorTest : public testing::Test {
 protected:
  static constexpr const char* kNoResponse =
      "<3>PithBackend(sendMessage): Pith adaptor (null) does not respond to forwarding selector "
      "sendMessageWithMethod:respCode:dict:";
  static constexpr const char* kRecord = "/var/log/tallyd/adaptor-record";

  AdaptorTest() {
    for (const char* name : {"playhall", "dialhouse", "fennel"}) {
      storebags.serve(name, {{"pith", Dictionary()}}, "max-age=600");
    }
  }

  void install(const char* bundle, const std::string& sample, const std::string& executable) {
    installBundle(root.under(bundle), sample, executable);
  }
  std::unique_ptr<TestDaemon> startedDaemon() {
    return std::make_unique<TestDaemon>(
        root, TestDaemon::Options{.environment = {{"TALLYD_TEST_RECORD", root.under(kRecord).string()}}});
  }
  static std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, std::int32_t clientType) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(9, clientType), std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"pith"}));
    return connection;
  }
  [[nodiscard]] std::vector<std::string> recorded() const {
    std::istringstream text(root.read(kRecord));
    std::vector<std::string> lines;
    for (std::string line; std::getline(text, line);) lines.push_back(line);
    return lines;
  }
  static Value valueIn(const std::string& line) {
    const std::string digits = line.substr(line.rfind(' ') + 1);
    std::string bytes;
    for (std::size_t i = 0; i + 1 < digits.size(); i += 2) {
      bytes += static_cast<char>(std::stoi(digits.substr(i, 2), nullptr, 16));
    }
    const auto read = platform::propertyListWithData(bytes);
    return read.value ? *read.value : Value();
  }

  StorebagServer storebags;
  TestRoot root{storebags};
};

TEST_F(AdaptorTest, GetsASessionsMessagesFromItsStartToItsEnd) {
  install(kFennelBundle, "RecordingAdaptor", "Fennel.so");
  const auto daemon = startedDaemon();
  auto session = startedSession(*daemon, 11);
  const Dictionary payload{{"text", "\xC3\xA4"}, {"number", 5}};
  EXPECT_EQ(session->sendMessageSync(3, 500, payload).value, std::nullopt);
  const auto lines = recorded();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[0], "create 1");
  EXPECT_EQ(lines[1], "message 1 0 0 nothing ");  // The start record.
  EXPECT_TRUE(lines[2].starts_with("message 1 3 500 payload ")) << lines[2];
  EXPECT_EQ(valueIn(lines[2]), Value(payload));
  session.reset();
  ASSERT_TRUE(daemon->process().waitForLine("<7>Sent internal message (method:0 respCode:1)"));
  EXPECT_EQ(valueIn(recorded().at(3)), Value(Dictionary{{"StorebagVersion", "1.0"}}));  // The stop record.
  EXPECT_TRUE(daemon->process().waitForLine(
      "<6>PithBackend(initWithName): Loading Pith adaptor class for client type 11"));
}

TEST_F(AdaptorTest, LoadsTheExecutableThatABundleNames) {
  install(kPerformanceBundle, "RecordingAdaptor", "Performance.dylib");
  writeBundleInfo(root.under(kPerformanceBundle), "Performance.dylib");
  const auto daemon = startedDaemon();
  startedSession(*daemon, 7);
  EXPECT_EQ(recorded().at(0), "create 1");
}

TEST_F(AdaptorTest, GivesEachSessionAnInstance) {
  install(kFennelBundle, "RecordingAdaptor", "Fennel.so");
  const auto daemon = startedDaemon();
  auto first = startedSession(*daemon, 11);
  auto second = startedSession(*daemon, 11);
  first->sendMessageSync(1, 0, std::nullopt);
  second->sendMessageSync(2, 0, std::nullopt);
  const auto lines = recorded();
  ASSERT_EQ(lines.size(), 6U);
  EXPECT_EQ(lines[4], "message 1 1 0 nothing ");
  EXPECT_EQ(lines[5], "message 2 2 0 nothing ");
}

TEST_F(AdaptorTest, LetsADaemonLiveWithoutABundle) {
  const auto daemon = startedDaemon();
  auto session = startedSession(*daemon, 11);
  EXPECT_EQ(session->sendMessageSync(1, 0, Dictionary{{"a", 1}}).value, std::nullopt);
  EXPECT_TRUE(daemon->process().waitForLineCount(kNoResponse, 2));  // The start record, and the message.
  EXPECT_TRUE(daemon->process().waitForLineStartingWith(
      "<4>Can't load code bundle " + (root.under(kFennelBundle) / "Fennel.so").string() + ": "));
}

TEST_F(AdaptorTest, LetsADaemonLiveWithAFileThatIsNoLibrary) {
  root.write(std::string(kFennelBundle) + "/Fennel.so", "not a library");
  const auto daemon = startedDaemon();
  startedSession(*daemon, 11);
  EXPECT_TRUE(daemon->process().waitForLineCount(kNoResponse, 1));
}

TEST_F(AdaptorTest, LetsADaemonLiveWithAnAdaptorThatThrows) {
  install(kFennelBundle, "ThrowingAdaptor", "Fennel.so");
  const auto daemon = startedDaemon();
  auto session = startedSession(*daemon, 11);
  session->sendMessageSync(4, 0, std::nullopt);
  EXPECT_TRUE(daemon->process().waitForLineCount(
      "<3>PithBackend: Pith adaptor threw in sendMessageWithMethod:respCode:dict:: no "
      "room for method 4",
      1));
  session.reset();
  EXPECT_TRUE(daemon->process().waitForLine("<3>PithBackend: Pith adaptor threw in destroy"));
  EXPECT_NE(startedSession(*daemon, 11), nullptr);
}

TEST_F(AdaptorTest, IsNotMadeForAnotherClientTypeOrDevice) {
  const auto daemon = startedDaemon();
  auto connection = daemon->connect();
  connection->setSessionInfoSync(sessionInfo(9, 5), std::nullopt);
  EXPECT_EQ(connection->startConfigSync().value, std::vector<std::string>());
  EXPECT_TRUE(daemon->process().waitForLine(
      "<3>PithBackend(initWithName): No matching bundle found for client type 5"));

  root.setDevice({{"DeviceName", "Kasten"}, {"ProductType", "Deskframe"}});
  auto other = daemon->connect();
  other->setSessionInfoSync(sessionInfo(10, 11), std::nullopt);
  EXPECT_EQ(other->startConfigSync().value, std::vector<std::string>());
  EXPECT_TRUE(daemon->process().waitForLineCount("<3>TallyBackend(newBackendWithName): pith", 1));
}

}  // namespace
}  // namespace tallyd::test
