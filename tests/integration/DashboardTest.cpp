// From a client's call to a datagram, and to an upload of log data.

#include <gtest/gtest.h>
#include <poll.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <iterator>
#include <set>

#include "backends/dashboard/Datagram.h"
#include "integration/TestDaemon.h"
#include "platform/property-list/PropertyList.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

class DashboardTest : public testing::Test {
 protected:
  static constexpr const char* kDevice = "0123456789abcdef0123456789abcdef01234567";

  void serve(const Dictionary& more = {}) {
    Dictionary entry{{"ip", "127.0.0.1"}, {"port", dashboard.port()}};
    entry.merge(more);
    storebags.serve("playhall", {{"dashboard", entry}}, "max-age=600");
  }
  std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, std::uint32_t sessionID) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(sessionID), std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"dashboard"}));
    return connection;
  }
  /// The next datagram that is no copy of an earlier one.
  std::string newDatagram() {
    while (auto datagram = dashboard.waitForDatagram()) {
      if (_seen.insert(*datagram).second) return *datagram;
    }
    ADD_FAILURE() << "no datagram came";
    return std::string(DatagramText, '\0');
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
      ::poll(nullptr, 0, 10);
    }
    return true;
  }

  StorebagServer storebags;
  LoopbackDashboard dashboard;
  TestRoot root{storebags};

 private:
  std::set<std::string> _seen;
};

TEST_F(DashboardTest, SendsADatagramAndAnswersWithItsLine) {
  serve({{"display_url", "https://show.example/"}});
  root.setDevice({{"DeviceName", "Kasten"}, {"UniqueDeviceID", kDevice}});
  root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 77);
  EXPECT_EQ(session->fetchDisplayURLSync().value, "https://show.example/?sequences=77&override=yes");
  const auto reply = session->sendMessageSync(3, 4, Dictionary{{"b", "x=y"}, {"a", 7}});

  std::string datagram = newDatagram();
  while (datagramNumber16(datagram, DatagramMethod) != 3)
    datagram = newDatagram();  // The start record first.
  EXPECT_EQ(datagramByte(datagram, DatagramClientType), 5);
  EXPECT_EQ(datagramNumber32(datagram, DatagramSessionID), ~77U);
  EXPECT_EQ(datagramNumber16(datagram, DatagramLength), static_cast<std::uint16_t>(~datagram.size()));
  EXPECT_EQ(datagramNumber16(datagram, DatagramRespCode), 4);
  EXPECT_EQ(datagramNumber16(datagram, DatagramFlags), 0);
  EXPECT_EQ(datagram.substr(DatagramDeviceID, 40), kDevice);
  EXPECT_EQ(datagram.substr(DatagramText), " a=7 b=x\\=y");

  const std::string line = reply.value.value_or("");
  EXPECT_NE(line.find(std::string(" ") + kDevice + " 127.0.0.1 PH "), std::string::npos) << line;
  EXPECT_TRUE(line.ends_with("    77     2     3     4  a=7 b=x\\=y")) << line;
  const auto diary = root.messageLog();
  EXPECT_NE(std::find(diary.begin(), diary.end(), "[dashboard -> sendMessageWithCategory] " + line),
            diary.end());
}

TEST_F(DashboardTest, SendsAgainUntilTheServerAnswers) {
  serve({{"reliable", 20}});
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 1);
  session->sendMessageSync(3, 0, Dictionary{{"a", 7}});
  std::string datagram = newDatagram();
  while (datagramNumber16(datagram, DatagramMethod) != 3) {
    dashboard.reply(datagram);
    datagram = newDatagram();
  }
  EXPECT_EQ(datagramNumber16(datagram, DatagramFlags), DatagramFlagReliable);
  auto again = dashboard.waitForDatagram();
  while (again && *again != datagram) again = dashboard.waitForDatagram();
  EXPECT_TRUE(again);
  dashboard.reply(datagram);
}

TEST_F(DashboardTest, UploadsLogDataAndReportsWhereItIs) {
  LoopbackServer logs(
      [](const ReceivedRequest&) { return ServedResponse{.body = "https://logs.example/7"}; });
  serve({{"post_url", logs.url("/upload")}});
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 1);
  const auto uploaded = session->uploadLogDataSync(Array{"line", 5, Dictionary{{"k", true}}});
  EXPECT_EQ(uploaded.error, std::nullopt);
  EXPECT_TRUE(uploaded.value.uploaded);
  EXPECT_TRUE(daemon.process().waitForLine(
      "<7>Tally (DashboardBackend): Log data uploaded to https://logs.example/7"));

  ASSERT_TRUE(logs.waitForRequests(1));
  const auto request = logs.requests()[0];
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.header("Content-Type"), "application/octet-stream");
  EXPECT_EQ(request.header("Content-Encoding"), std::nullopt);
  const auto archive = platform::propertyListWithData(request.body).value;
  ASSERT_TRUE(archive && archive->dictionary());
  EXPECT_EQ(archive->dictionary()->string("$archiver"), "NSKeyedArchiver");

  std::string datagram = newDatagram();
  while (datagramNumber16(datagram, DatagramRespCode) != 2) datagram = newDatagram();
  EXPECT_EQ(datagramNumber16(datagram, DatagramMethod), 0);
  EXPECT_EQ(datagram.substr(DatagramText), " LogDataUploadLocation=https://logs.example/7");
}

TEST_F(DashboardTest, LeavesNoDescriptorBehindAfterSecondStartsAndEnds) {
  serve({{"reliable", 20}});
  TestDaemon daemon(root);
  startedSession(daemon, 1).reset();  // What a first session leaves open is the daemon's own.
  ASSERT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 1"));
  ASSERT_TRUE(daemon.process().waitForLine("<7>Tally: clean up at myPeriodicTask."));
  auto observer = daemon.connect();
  EXPECT_EQ(observer->fetchDisplayURLSync().value, "URL not available");
  const std::size_t before = descriptorCount(daemon);
  for (std::uint32_t sessionID = 2; sessionID < 12; ++sessionID) {
    auto session = startedSession(daemon, sessionID);
    session->sendMessageSync(3, 0, Dictionary{{"a", 1}});
    EXPECT_EQ(session->startConfigSync().value, (std::vector<std::string>{"dashboard"}));
    session->sendMessageSync(3, 0, Dictionary{{"a", 2}});
  }
  EXPECT_TRUE(waitForDescriptors(daemon, before)) << descriptorCount(daemon);
}

TEST_F(DashboardTest, GoesOnWithoutADashboardWhoseEntryIsUnusable) {
  const auto serveAs = [&](const char* name, const Dictionary& entry) {
    storebags.serve(name, {{"dashboard", entry}}, "max-age=600");
  };
  serveAs("vitrine", {{"port", 5}});
  serveAs("dialhouse", {{"ip", "127.0.0.1"}, {"port", Array{5}}});
  serveAs("lanternbox", {{"ip", "no address"}, {"port", 5}, {"reliable", -1}});
  serve({{"reliable", "text"}, {"display_url", 5}, {"post_url", Array()}});
  TestDaemon daemon(root);
  for (const std::int32_t clientType : {6, 7, 8}) {
    auto connection = daemon.connect();
    connection->setSessionInfoSync(sessionInfo(1, clientType), std::nullopt);
    EXPECT_EQ(connection->startConfigSync().value.value_or(std::vector<std::string>()),
              std::vector<std::string>())
        << clientType;
  }
  EXPECT_TRUE(daemon.process().waitForLine("<3>Tally(DashboardBackend): can't resolve server IP"));
  EXPECT_TRUE(daemon.process().waitForLine("<3>Tally(DashboardBackend): can't resolve server port"));
  EXPECT_TRUE(
      daemon.process().waitForLine("<3>Tally (DashboardBackend): initWitName socket connect failed."));
  auto session = startedSession(daemon, 2);
  EXPECT_FALSE(session->uploadLogDataSync(Array{"line"}).value.uploaded);
  EXPECT_TRUE(
      daemon.process().waitForLine("<3>Tally (DashboardBackend): Post URL for log data array is nil"));
  EXPECT_TRUE(session->sendMessageSync(3, 0, Dictionary{{"a", 1}}).value);
}

}  // namespace
}  // namespace tallyd::test
