// What tally-storebag predicts is what the real daemon sends, byte for byte.

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <condition_variable>
#include <fstream>
#include <mutex>
#include <sstream>

#include "backends/dashboard/Datagram.h"
#include "framework/TallyKeys.h"
#include "integration/TestDaemon.h"
#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "support/RawServer.h"
#include "tally-storebag/Documents.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;

constexpr const char* kDeviceID = "0123456789abcdef0123456789abcdef01234567";

/// Keeps every request as it came over the wire.
class RawCollector {
 public:
  [[nodiscard]] std::string url() const { return _server.url("/events"); }

  /// The request of this number, from 0; empty when it does not come.
  std::string request(std::size_t number) {
    std::unique_lock lock(_mutex);
    const bool came =
        _changed.wait_for(lock, WatchedProcess::kPatience, [&] { return _requests.size() > number; });
    EXPECT_TRUE(came) << "request " << number << " did not come";
    return came ? _requests[number] : "";
  }

 private:
  void serve(RawConnection& connection) {
    while (true) {
      std::string request = connection.readRequest();
      if (request.empty()) return;
      {
        const std::lock_guard lock(_mutex);
        _requests.push_back(std::move(request));
        _changed.notify_all();
      }
      connection.write("HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
    }
  }

  std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::string> _requests;
  RawServer _server{[this](RawConnection& connection) { serve(connection); }};
};

struct SplitRequest {
  std::string header;
  std::string body;
};

SplitRequest split(const std::string& request) {
  const auto end = request.find("\r\n\r\n");
  if (end == std::string::npos) return {};
  return {request.substr(0, end), request.substr(end + 4)};
}

std::string fileText(const std::filesystem::path& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

class StorebagToolTest : public testing::Test {
 protected:
  StorebagToolTest() {
    const Dictionary bag = theBag();
    storebags.serveBag("playhall", bag, "max-age=600");
    root.write("/bag.plist", *platform::dataWithPropertyList(bag, platform::PropertyListFormat::XML));
    root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
    root.setDevice({{"UniqueDeviceID", kDeviceID},
                    {"ProductVersion", "12.4"},
                    {"BuildVersion", "12D500"},
                    {"ProductType", "Kasten3,1"},
                    {"DeviceName", "Kasten"}});
  }

  [[nodiscard]] Dictionary theBag() const {
    const Dictionary entry{
        {"client", "demo"},
        {"locale_whitelist", Array{"DE"}},
        {"device_whitelist", Array{"Kasten"}},
        {"sampling_threshold", 1},
        {"post_url", collector.url()},
        {"filters", Array{Dictionary{{"key", "token"}, {"action", "remove"}},
                          Dictionary{{"key", "peer"}, {"action", "sha256"}, {"method", 3}}}}};
    return {
        {"version", "1"},
        {"release", Dictionary{{"splunk", Dictionary{{"clients", Array{entry}}}},
                               {"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", dashboard.port()}}}}}};
  }

  /// Starts a session, lets its start record come and sends one message.
  void sendMessage(TestDaemon& daemon) {
    session = daemon.connect();
    const auto info = sessionInfo(42, 5, {{std::string(kTallySessionInfoRequireUserInfo), true}});
    const Dictionary user{{std::string(kTallyUserInfoClientName), "demo"}, {"Region", "north"}};
    ASSERT_EQ(session->setSessionInfoSync(info, user).value, "received");
    ASSERT_EQ(session->startConfigSync().value, (std::vector<std::string>{"dashboard", "splunk"}));
    ASSERT_FALSE(collector.request(0).empty());
    ASSERT_TRUE(dashboard.waitForDatagram());
    session->sendMessageSync(3, 0, Dictionary{{"token", "secret"}, {"peer", "bob"}, {"rtt", 12.5}});
  }

  /// Has the tool predict the same message; the bytes then lie in files.
  void predict(const std::vector<std::string>& more) {
    std::vector<std::string> arguments{TALLYD_BIN_DIR "/tally-storebag",
                                       "explain",
                                       root.under("/bag.plist"),
                                       "--require-user-info",
                                       "--session-id",
                                       "42",
                                       "--client-name",
                                       "demo",
                                       "--user-info",
                                       "Region=north",
                                       "--consent",
                                       "yes",
                                       "--device-id",
                                       kDeviceID,
                                       "--product-version",
                                       "12.4",
                                       "--build-version",
                                       "12D500",
                                       "--product-type",
                                       "Kasten3,1",
                                       "--device-family",
                                       "Kasten",
                                       "--category",
                                       "3",
                                       "--type",
                                       "0",
                                       "token=secret",
                                       "peer=bob",
                                       "rtt=12.5",
                                       "--raw",
                                       root.under("/raw")};
    arguments.insert(arguments.end(), more.begin(), more.end());
    WatchedProcess tool({.arguments = std::move(arguments)});
    EXPECT_EQ(tool.wait().code, 0) << tool.output();
    explanation = tool.output();
  }
  [[nodiscard]] std::string predicted(const std::string& name) const {
    return fileText(root.under("/raw/" + name));
  }

  StorebagServer storebags;
  RawCollector collector;
  LoopbackDashboard dashboard;
  TestRoot root{storebags};
  std::unique_ptr<TallyConnection> session;
  std::string explanation;
};

/// What only the received document can tell: identifiers and times.
std::vector<std::string> circumstances(const Dictionary& document) {
  const Dictionary& event = *(*document.array("events"))[0].dictionary();
  std::string postTime(document.string("postTime").value_or(""));
  std::replace(postTime.begin(), postTime.end(), ' ', '0');  // Padded milliseconds.
  const auto text = [&event](std::string_view key) { return std::string(event.string(key).value_or("")); };
  return {"--client-id",
          std::string(document.string("clientId").value_or("")),
          "--session-key",
          text("_sessionID"),
          "--session-start",
          text("_startTS"),
          "--time",
          text("eventTime"),
          "--post-time",
          postTime,
          "--timezone-offset",
          std::to_string(event.integer("_timezoneOffset").value_or(0))};
}

TEST_F(StorebagToolTest, PredictsThePostedBytes) {
  TestDaemon daemon(root, {.environment = {{"LC_ALL", "de_DE.UTF-8"}, {"TZ", "UTC-2"}}});
  sendMessage(daemon);
  const auto [header, body] = split(collector.request(1));
  const std::string json = storebagtool::gunzipped(body).value_or(body);
  const auto document = platform::valueFromJSON(json).value;
  ASSERT_TRUE(document) << json;

  auto known = circumstances(*document->dictionary());
  known.insert(known.end(), {"--country", "DE"});
  predict(known);
  EXPECT_EQ(predicted("message-splunk-1.body"), body) << explanation;
  EXPECT_EQ(json.find("secret"), std::string::npos);
  EXPECT_EQ(json.find("bob"), std::string::npos);
  EXPECT_NE(json.find("\"Region\":\"north\""), std::string::npos);
  for (const std::string line : {"X-RTC-Client-Name: demo", "Accept: application/json",
                                 "Content-Type: application/json", "Content-Encoding: gzip"}) {
    EXPECT_NE(header.find(line), std::string::npos) << header;
    EXPECT_NE(explanation.find(line), std::string::npos) << explanation;
  }
  const std::string length = "Content-Length: " + std::to_string(body.size());
  EXPECT_NE(header.find(length), std::string::npos);
  EXPECT_NE(explanation.find(length), std::string::npos);
}

TEST_F(StorebagToolTest, PredictsTheDatagram) {
  TestDaemon daemon(root, {.environment = {{"LC_ALL", "de_DE.UTF-8"}}});
  sendMessage(daemon);
  const std::string datagram = dashboard.waitForDatagram().value_or("");
  ASSERT_GT(datagram.size(), DatagramText);
  const auto microseconds = datagramByte(datagram, DatagramSubsecond) * kDatagramSubsecondMicroseconds;
  predict({"--country", "DE", "--time",
           fmt::format("{}.{:06}", datagramNumber32(datagram, DatagramSeconds), microseconds)});
  EXPECT_EQ(predicted("message-dashboard-1.datagram"), datagram) << explanation;
}

TEST_F(StorebagToolTest, PredictsThatNothingIsPosted) {
  TestDaemon daemon(root, {.environment = {{"LC_ALL", "fr_FR.UTF-8"}}});
  session = daemon.connect();
  const auto info = sessionInfo(42, 5, {{std::string(kTallySessionInfoRequireUserInfo), true}});
  const Dictionary user{{std::string(kTallyUserInfoClientName), "demo"}};
  ASSERT_EQ(session->setSessionInfoSync(info, user).value, "received");
  EXPECT_EQ(session->startConfigSync().value, (std::vector<std::string>{"dashboard"}));
  predict({"--country", "FR"});
  EXPECT_NE(explanation.find("country \"FR\" does not pass"), std::string::npos) << explanation;
  EXPECT_EQ(predicted("message-splunk-1.body"), "");
}

}  // namespace
}  // namespace tallyd::test
