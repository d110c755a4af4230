// The real daemon against the real station: storebags, events, datagrams over a bad network, files, log data.

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>
#include <thread>

#include "integration/TestDaemon.h"
#include "platform/JSON.h"
#include "support/ChildProcess.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;
using Stream = ChildProcess::Stream;

std::string contentsOf(const std::filesystem::path& file) {
  std::ostringstream text;
  text << std::ifstream(file, std::ios::binary).rdbuf();
  return text.str();
}

class StationTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { ::setenv("no_proxy", "127.0.0.1,localhost", 1); }

  /// Starts the station and makes the root trust it and ask it for storebags.
  void startStation(const std::vector<std::string>& options = {}) {
    std::vector<std::string> arguments{"--directory", directory.string(), "--port",
                                       "0",           "--datagram-port",  "0"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    station = std::make_unique<ChildProcess>(TALLYD_BIN_DIR "/tally-station", arguments);
    ASSERT_TRUE(station->waitForText(Stream::Output, "ready\n")) << station->text(Stream::Errors);
    const auto ready = platform::valueFromJSON(contentsOf(directory / "station.json")).value;
    ASSERT_TRUE(ready && ready->dictionary());
    https = "https://127.0.0.1:" + std::to_string(ready->dictionary()->integer("https_port").value_or(0));
    datagramPort = static_cast<int>(ready->dictionary()->integer("datagram_port").value_or(0));
    root.write("/etc/tally/ca.pem", contentsOf(directory / "ca.pem"));
    root.write("/usr/share/tally/Tally.framework/Resources/publicKey.der",
               contentsOf(directory / "publicKey.der"));
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", https + "/bags/sorrel"}});
  }
  void writeBag(const std::string& backends) const {
    std::ofstream(directory / "bags/playhall.plist")
        << "{ version = \"1.0\"; release = { " << backends << " }; }";
  }
  [[nodiscard]] std::string dashboard(const std::string& more) const {
    return "dashboard = { ip = \"127.0.0.1\"; port = \"" + std::to_string(datagramPort) + "\"; " + more +
           " };";
  }
  static std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, std::uint32_t sessionID,
                                                         const std::string& backend) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(sessionID), std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{backend}));
    return connection;
  }
  [[nodiscard]] std::vector<Dictionary> records(const char* file) const {
    std::vector<Dictionary> records;
    std::istringstream lines(contentsOf(directory / file));
    for (std::string line; std::getline(lines, line);) {
      const auto value = platform::valueFromJSON(line).value;
      // The last line may be half written.
      if (value && value->dictionary()) records.push_back(*value->dictionary());
    }
    return records;
  }
  /// Waits until the station has shown a line for each of these texts.
  void waitForAll(const std::vector<std::string>& texts) const {
    for (const auto& text : texts) ASSERT_TRUE(station->waitForText(Stream::Output, text)) << text;
  }

  static std::size_t descriptorCount(TestDaemon& daemon) {
    const std::filesystem::directory_iterator all("/proc/" + std::to_string(daemon.process().pid()) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
  }
  /// Waits until the daemon has no more descriptors than that.
  static bool waitForDescriptors(TestDaemon& daemon, std::size_t count) {
    const auto deadline = std::chrono::steady_clock::now() + WatchedProcess::kPatience;
    while (descriptorCount(daemon) > count) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::yield();
    }
    return true;
  }

  StorebagServer unused;  ///< What the root is made for; the station takes its place.
  TestRoot root{unused};
  fakes::TemporaryFolder folder;
  const std::filesystem::path directory = folder.path() / "station";
  std::unique_ptr<ChildProcess> station;
  std::string https;
  int datagramPort = 0;
};

TEST_F(StationTest, GetsEveryReliableDatagramThroughABadNetwork) {
  constexpr int kMessages = 40;  // The daemon keeps 50 at most.
  startStation({"--lose", "10", "--lose-acks", "30", "--duplicate", "20", "--reorder", "20", "--delay", "2",
                "--seed", "1"});
  writeBag(dashboard("reliable = \"100\";"));
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 77, "dashboard");
  for (int i = 0; i < kMessages; ++i) {
    session->sendMessageSync(3, 4, Dictionary{{"serial", i}, {"odd", "x=y \\ z"}});
  }
  std::set<std::string> serials;
  const auto deadline = std::chrono::steady_clock::now() + WatchedProcess::kPatience;
  while (serials.size() < kMessages && std::chrono::steady_clock::now() < deadline) {
    for (const Dictionary& record : records("datagrams.jsonl")) {
      const Dictionary* fields = record.dictionary("fields");
      if (fields != nullptr && fields->string("serial")) {
        EXPECT_EQ(fields->string("odd"), "x=y \\ z");
        EXPECT_EQ(record.integer("session"), 77);
        EXPECT_EQ(record.integer("method"), 3);
        EXPECT_EQ(record.integer("status"), 4);
        serials.emplace(*fields->string("serial"));
      }
    }
    std::this_thread::yield();
  }
  EXPECT_EQ(serials.size(), static_cast<std::size_t>(kMessages));
  station->sendSignal(SIGTERM);
  EXPECT_EQ(station->waitForExit(), 0);
  const auto kept = records("datagrams.jsonl");
  EXPECT_TRUE(std::any_of(kept.begin(), kept.end(), [](const auto& r) { return r.boolean("duplicate"); }));
  EXPECT_NE(station->text(Stream::Output).find("lost on purpose]\n"), std::string::npos);
}

TEST_F(StationTest, IsSentAgainWhatItDidNotAcknowledge) {
  startStation({"--lose-acks", "100"});
  writeBag(dashboard("reliable = \"20\";"));
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 78, "dashboard");
  session->sendMessageSync(3, 4, Dictionary{{"serial", 1}});
  waitForAll(
      {" serial=1  [datagram, reliable]\n", " serial=1  [datagram, reliable, retransmission, duplicate]\n"});
}

TEST_F(StationTest, LeavesNothingPendingOfWhatItAcknowledged) {
  startStation();
  writeBag(dashboard("reliable = \"1000\";"));
  std::ofstream(directory / "bags/vitrine.plist")
      << "{ version = \"1.0\"; release = { upload_server = { post_url = \"" << https << "/upload\"; }; }; }";
  TestDaemon daemon(root);
  auto observer = daemon.connect();  // What a first session leaves open is the daemon's own.
  observer->setSessionInfoSync(sessionInfo(1, 6), std::nullopt);
  observer->startConfigSync();
  const std::size_t before = descriptorCount(daemon);
  auto session = startedSession(daemon, 79, "dashboard");
  session->sendMessageSync(3, 4, Dictionary{{"serial", 1}});
  waitForAll({" serial=1  [datagram, reliable"});
  session.reset();
  EXPECT_TRUE(waitForDescriptors(daemon, before)) << descriptorCount(daemon);
  EXPECT_EQ(daemon.process().count("<7>Tally: scheduled last resort clean-up in 9500 ms."), 0U);
}

TEST_F(StationTest, TakesUploadsAndLetsTheDaemonDeleteThem) {
  startStation();
  root.setDevice({{"DeviceName", "Kasten"}, {"UniqueDeviceID", std::string(40, 'a')}});
  writeBag("upload_server = { post_url = \"" + https + "/upload\"; };");
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 42, "upload_server");
  root.write("/var/mobile/a b.log", std::string(100'000, 'x') + "end");
  EXPECT_TRUE(session->uploadFileSync(root.under("/var/mobile/a b.log")).value);
  EXPECT_FALSE(std::filesystem::exists(root.under("/var/mobile/a b.log")));
  const auto kept = records("uploads.jsonl");
  ASSERT_EQ(kept.size(), 1U);
  EXPECT_EQ(kept[0].string("uuid"), std::string(40, 'a'));
  EXPECT_EQ(kept[0].string("sequence"), "42");
  EXPECT_EQ(kept[0].string("description"), "Parlor QPRC log (Uploaded by PHS)");
  EXPECT_EQ(kept[0].string("filename"), "a b.log.gz");
  EXPECT_EQ(contentsOf(directory / std::string(kept[0].string("file").value_or(""))),
            std::string(100'000, 'x') + "end");
}

TEST_F(StationTest, LetsTheDaemonKeepWhatItCannotTake) {
  startStation();
  writeBag("upload_server = { post_url = \"" + https + "/upload\"; };");
  std::ofstream(directory / "uploads") << "no folder";
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 42, "upload_server");
  root.write("/var/mobile/a.log", "text");
  EXPECT_TRUE(session->uploadFileSync(root.under("/var/mobile/a.log")).value);
  EXPECT_TRUE(std::filesystem::exists(root.under("/var/mobile/a.log")));
}

TEST_F(StationTest, TakesLogDataAndIsToldWhereItIs) {
  startStation();
  writeBag(dashboard("post_url = \"" + https + "/log-data\";"));
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 5, "dashboard");
  const Array logData{"line", 5, Dictionary{{"k", true}}};
  EXPECT_TRUE(session->uploadLogDataSync(logData).value.uploaded);
  const auto kept = records("logdata.jsonl");
  ASSERT_EQ(kept.size(), 1U);
  ASSERT_NE(kept[0].array("logData"), nullptr);
  EXPECT_EQ(*kept[0].array("logData"), logData);
  waitForAll({" LogDataUploadLocation=" + (directory / "logdata.jsonl").string() + ":1"});
}

}  // namespace
}  // namespace tallyd::test
