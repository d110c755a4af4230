// Whole sessions: from a client's call over the socket to a posted event.

#include <gtest/gtest.h>

#include <csignal>
#include <future>

#include "integration/TestDaemon.h"
#include "support/GzipCompression.h"
#include "support/NginxProxy.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Date;
using platform::Dictionary;
using platform::Value;

class SessionTest : public testing::Test {
 protected:
  SessionTest() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    postTo(collector.url("/events"));
  }

  void postTo(const std::string& url) {
    root.setPreferences("com.quillon.tally",
                        {{"tally_storebag_url", storebags.baseURL()}, {"httpsPostURL", url}});
  }
  void consent() {
    root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
  }

  /// A configured and started session.
  std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, const Dictionary& info) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(info, std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"splunk"}));
    return connection;
  }

  StorebagServer storebags;
  LoopbackServer collector;
  TestRoot root{storebags};
};

TEST_F(SessionTest, PostsAMessageWithEveryFieldOfTheRecord) {
  consent();
  root.setDevice({{"UniqueDeviceID", "0123456789abcdef0123456789abcdef01234567"},
                  {"ProductVersion", "12.4"},
                  {"BuildVersion", "12D500"},
                  {"ProductType", "Kasten3,1"},
                  {"DeviceName", "Kasten"}});
  TestDaemon daemon(root, {.environment = {{"TZ", "UTC-2"}}});
  auto session = startedSession(daemon, sessionInfo(42, 5, {{"ClientVersion", 65'537}}));
  const auto reply =
      session->sendMessageSync(3, 0, Dictionary{{"speed", 2.5}, {"at", Date{1.5}}, {"ok", true}});
  ASSERT_TRUE(reply.value);
  ASSERT_TRUE(collector.waitForRequests(2));  // The start record, then the message.

  // The two posts may overtake each other.
  const auto events = receivedEvents(collector);
  ASSERT_EQ(events.size(), 2U);
  const std::size_t message = events[0].string("_eventNumber") == "2" ? 0 : 1;
  const Dictionary& event = events[message];
  EXPECT_EQ(event.string("_sender"), "PH");
  EXPECT_EQ(event.string("_clientVersion"), "1");
  EXPECT_EQ(event.string("_eventNumber"), "2");
  EXPECT_EQ(event.string("_method"), "3");
  EXPECT_EQ(event.string("_status"), "0");
  EXPECT_EQ(event.string("_productFamily"), "Kasten");
  EXPECT_EQ(event.string("_productModel"), "Kasten3,1");
  EXPECT_EQ(event.string("_osVersion"), "12.4");
  EXPECT_EQ(event.string("_build"), "12D500");
  EXPECT_EQ(event.string("_internal"), "0");
  EXPECT_EQ(event.string("_reportVers"), "7.0");
  EXPECT_EQ(event.string("_sessionID")->size(), 24U);
  EXPECT_EQ(*event.find("_timezoneOffset"), Value(7200));
  EXPECT_EQ(*event.find("speed"), Value(2.5));
  EXPECT_EQ(*event.find("at"), Value("1.500"));
  EXPECT_EQ(*event.find("ok"), Value(true));
  EXPECT_EQ(events[1 - message].string("_method"), "0");

  const auto post = collector.requests()[message];
  EXPECT_EQ(post.method, "POST");
  EXPECT_EQ(post.target, "/events");
  EXPECT_EQ(post.header("Content-Type"), "application/json");
  EXPECT_EQ(post.header("Accept"), "application/json");
  EXPECT_EQ(post.header("Content-Encoding"), "gzip");
  EXPECT_EQ(post.header("X-RTC-Internal-Build"), std::nullopt);
  EXPECT_EQ(post.body, *reply.value);  // What the client hears is what was posted.
}

TEST_F(SessionTest, HoldsEventsBackUntilTheFlush) {
  consent();
  TestDaemon daemon(root);
  auto session = startedSession(daemon, sessionInfo(1, 5, {{"BatchEvent", true}}));
  for (int i = 0; i < 60; ++i)
    EXPECT_EQ(session->sendMessageSync(4, 0, Dictionary{{"i", i}}).value, std::nullopt);
  EXPECT_EQ(collector.requests().size(), 0U);
  EXPECT_TRUE(session->flushMessagesSync().value);
  ASSERT_TRUE(collector.waitForRequests(1));
  const auto events = receivedEvents(collector);
  EXPECT_EQ(events.size(), 1U + 50U);  // The start record, and 50 of one method.
  EXPECT_EQ(daemon.process().countOnce("<7>HTTPSPostBackend: Dropping batched event (4)", 10), 10U);

  EXPECT_EQ(session->flushMessagesSync().value, std::nullopt);
  session->sendMessageSync(4, 0, Dictionary{{"i", 60}});
  EXPECT_TRUE(session->flushMessagesSync().value);
  ASSERT_TRUE(collector.waitForRequests(2));
  EXPECT_EQ(receivedEvents(collector).size(), 52U);
}

TEST_F(SessionTest, AnswersEveryOperation) {
  TestDaemon daemon(root);
  auto session = daemon.connect();
  EXPECT_EQ(session->setSessionInfoSync(sessionInfo(7), std::nullopt, {"Framework"}).value, "received");
  EXPECT_EQ(session->fetchStatesSync(std::nullopt).value, std::nullopt);
  EXPECT_EQ(session->sendMessageSync(1, 0, Dictionary{{"a", 1}}).value, std::nullopt);
  EXPECT_EQ(session->flushMessagesSync().value, std::nullopt);
  EXPECT_EQ(session->startConfigSync().value, (std::vector<std::string>{"splunk"}));
  EXPECT_EQ(session->fetchStatesSync(std::nullopt).value, (std::vector<std::string>{"splunk"}));
  EXPECT_EQ(session->fetchDisplayURLSync().value, "URL not available");
  EXPECT_EQ(session->sendMessageSync(1, 0, Dictionary{{"a", 1}}).value,
            std::nullopt);  // No consent: no text.
  const auto file = root.under("/var/mobile/a b.log");
  root.write("/var/mobile/a b.log", "text");
  EXPECT_FALSE(session->uploadFileSync(file).value);
  const auto uploaded = session->uploadLogDataSync(Array{Value("line"), Value(5)});
  EXPECT_EQ(uploaded.error, std::nullopt);
  EXPECT_FALSE(uploaded.value.uploaded);
  EXPECT_EQ(uploaded.value.error, std::nullopt);
  EXPECT_EQ(
      session->sendMessageWithSessionInfoSync(sessionInfo(8), std::nullopt, 5, 0, Dictionary{{"b", 2}}).value,
      "finished");

  EXPECT_EQ(daemon.process().countOnce("<2>File upload failed for " + file.string(), 1), 1U);
  EXPECT_EQ(daemon.process().countOnce("<7>TallydSession: Uploading log data array: (line, 5)", 1), 1U);
  EXPECT_EQ(daemon.process().countOnce("<2>Log data array upload failed", 1), 1U);
  std::string escaped = "file://" + file.string();
  escaped.replace(escaped.find(' '), 1, "%20");
  EXPECT_EQ(root.messageLog(), std::vector{"[uploadFileWithURL] Upload failed for file " + escaped});
}

TEST_F(SessionTest, WritesTheDiaryWhenTheUserConsents) {
  consent();
  TestDaemon daemon(root);
  auto session = startedSession(daemon, sessionInfo(1));
  const auto reply = session->sendMessageSync(1, 0, Dictionary{{"a", 1}});
  // The start record leaves with the first change of state, which reports to nobody.
  EXPECT_EQ(root.messageLog(),
            std::vector{"[splunk -> sendMessageWithCategory] " + reply.value.value_or("")});
  session.reset();
  ASSERT_TRUE(daemon.process().waitForLine("<7>Sent internal message (method:0 respCode:1)"));
  const auto diary = root.messageLog();
  ASSERT_EQ(diary.size(), 2U);
  EXPECT_TRUE(diary[1].starts_with("[splunk -> internalSendMessage] {")) << diary[1];
}

TEST_F(SessionTest, LogsASessionFromItsConnectionToItsEnd) {
  TestDaemon daemon(root);
  startedSession(daemon, sessionInfo(9)).reset();
  ASSERT_TRUE(daemon.process().waitForLine("<7>Sent internal message (method:0 respCode:1)"));
  const std::vector<std::string> expected{
      "<7>Accepting new XPC connection ",
      "<7>TallydSession initWithSessionDelegate:",
      "<7>Initialized session with UUID ",
      "<7>Configuring session 9",
      "<7>Received nil user info for session 9",
      "<7>Starting configuration for session 9",
      "<7>Retrieving storebag for session 9 with client type 5",
      "<7>Fetching storebag for client type 5",
      "<7>Storebag Server URL: " + storebags.baseURL() + "/playhall?version=7.0",
      "<6>Environment type 4",
      "<7>Storebag max age: 600 seconds",
      "<7>Creating backends for session 9",
      "<7>Using user default '",
      "<7>Tally (sendMessage): 0, 0, 0",
      "<7>Sent internal message (method:0 respCode:0)",
      "<7>Received nil user info for session 9",
      "<7>XPC connection to <TallydSession: ",
      "<7>TallydSession dealloc: 9",
      "<7>HTTPSPostBackend: Adding dnu type and sampling threshold to SESSION_TYPE_STOP message dictionary",
      "<7>Sent internal message (method:0 respCode:1)"};
  const auto lines = daemon.process().lines();
  auto line = lines.begin();
  for (const auto& start : expected) {
    line = std::find_if(line, lines.end(), [&](const std::string& text) { return text.starts_with(start); });
    ASSERT_NE(line, lines.end()) << "missing or out of order: " << start;
    ++line;
  }
}

TEST_F(SessionTest, SendsTheStopRecordOfAClientThatWasKilled) {
  TestDaemon daemon(root);
  const pid_t client = fork();
  if (client == 0) {
    TallyConnection connection(root.socket());
    connection.setSessionInfoSync(sessionInfo(5, 5, {{"BatchEvent", true}}), std::nullopt);
    connection.startConfigSync();
    connection.sendMessageSync(6, 0, Dictionary{{"last", "words"}});
    raise(SIGKILL);
  }
  ASSERT_TRUE(collector.waitForRequests(1));
  waitpid(client, nullptr, 0);
  const auto events = receivedEvents(collector);
  ASSERT_EQ(events.size(), 3U);
  EXPECT_EQ(events[1].string("last"), "words");
  EXPECT_EQ(events[2].string("_method"), "0");
  EXPECT_EQ(events[2].string("_status"), "1");
  EXPECT_EQ(events[2].string("StorebagVersion"), "1.0");
  EXPECT_EQ(*events[2].find("SamplingThreshold"), Value(-1));
  EXPECT_EQ(*events[2].find("Opt"), Value(0));
  EXPECT_EQ(*events[2].find("AutomaticTimeSet"), Value(true));
}

TEST_F(SessionTest, NeverAnswersAOneShotSendWithoutIdentifiers) {
  TestDaemon daemon(root);
  std::promise<void> answered;
  TallyConnection connection(root.socket());
  connection.sendMessageWithSessionInfo(Dictionary{{"ClientType", 5}}, std::nullopt, 1, 0, std::nullopt,
                                        [&](const auto&) { answered.set_value(); });
  // Calls are answered in order: once this one is, the one before it will never be.
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "URL not available");
  EXPECT_EQ(answered.get_future().wait_for(std::chrono::seconds(0)), std::future_status::timeout);
  EXPECT_EQ(daemon.process().countOnce("<2>Could not retrieve identifiers from sessionInfo", 1), 1U);
}

TEST_F(SessionTest, SendsAOneShotMessageWithoutStartOrStopRecord) {
  TestDaemon daemon(root);
  daemon.connect()->sendMessageWithSessionInfoSync(sessionInfo(77), std::nullopt, 500, 300,
                                                   Dictionary{{"only", 1}});
  ASSERT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 77"));
  ASSERT_TRUE(collector.waitForRequests(1));
  const auto events = receivedEvents(collector);
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].string("_method"), "500");
  EXPECT_EQ(events[0].string("_status"), "300");
  EXPECT_EQ(events[0].string("_sessionID"), "77");
}

TEST_F(SessionTest, ReadsThePostURLAtEveryStart) {
  TestDaemon daemon(root);
  startedSession(daemon, sessionInfo(1));
  ASSERT_TRUE(collector.waitForRequests(2));
  LoopbackServer other;
  postTo(other.url("/elsewhere"));
  startedSession(daemon, sessionInfo(2));
  EXPECT_TRUE(other.waitForRequests(2));
}

TEST_F(SessionTest, ServesTheCachedStorebagWhileItIsFresh) {
  TestDaemon daemon(root);
  startedSession(daemon, sessionInfo(1));
  startedSession(daemon, sessionInfo(2));
  EXPECT_EQ(storebags.http().requests().size(), 1U);
  EXPECT_EQ(daemon.process().countOnce("<7>Cached storebag found for client type 5", 1), 1U);
}

TEST_F(SessionTest, WaitsAfterAFailedFetch) {
  storebags.serveWith("vitrine",
                      [](const ReceivedRequest&) { return ServedResponse{.status = 404, .body = "none"}; });
  TestDaemon daemon(root);
  auto connection = daemon.connect();
  connection->setSessionInfoSync(sessionInfo(1, 6), std::nullopt);
  EXPECT_EQ(connection->startConfigSync().value, std::nullopt);
  EXPECT_EQ(connection->startConfigSync().value, std::nullopt);
  EXPECT_EQ(storebags.http().requests().size(), 1U);
  EXPECT_TRUE(daemon.process().waitForLine(
      "<6>Not fetching storebag for client type 6 - must wait 900 seconds between attempts"));
  EXPECT_EQ(daemon.process().countOnce("<2>Signature is missing", 1), 1U);
  const std::string target = storebags.http().requests().at(0).target;
  EXPECT_EQ(daemon.process().countOnce(
                "<4>Storebag server answers status 404 for " + storebags.http().url(target), 1),
            1U);
  EXPECT_EQ(connection->sendMessageSync(1, 0, Dictionary{{"a", 1}}).value, std::nullopt);
  EXPECT_EQ(daemon.process().countOnce("<7>No backends available to send message", 1), 1U);
}

TEST_F(SessionTest, DelaysNobodyWhileStorebagServersHang) {
  std::promise<void> release;
  const std::shared_future<void> released = release.get_future().share();
  storebags.serveWith("vitrine", [released](const ReceivedRequest&) {
    released.wait();
    return ServedResponse{.status = 500};
  });
  TestDaemon daemon(root);
  // More hanging sessions than any pool has threads at rest.
  constexpr int kHanging = 12;
  std::vector<std::unique_ptr<TallyConnection>> hanging;
  std::atomic<int> answered = 0;
  for (int i = 0; i < kHanging; ++i) {
    hanging.push_back(daemon.connect());
    hanging.back()->setSessionInfo(sessionInfo(100U + static_cast<unsigned>(i), 6), std::nullopt, {}, {});
    hanging.back()->startConfig([&](const auto&) { ++answered; });
  }
  ASSERT_TRUE(daemon.process().waitForLineCount("<7>Fetching storebag for client type 6", kHanging));
  auto session = startedSession(daemon, sessionInfo(1));
  session->sendMessageSync(1, 0, Dictionary{{"a", 1}});
  EXPECT_TRUE(collector.waitForRequests(2));
  EXPECT_EQ(answered, 0);
  release.set_value();
  hanging.clear();
}

TEST_F(SessionTest, WorksOnADeviceThatAnswersNothingButItsName) {
  root.setDevice({{"DeviceName", "Kasten"}});
  TestDaemon daemon(root);
  startedSession(daemon, sessionInfo(1))->sendMessageSync(1, 0, Dictionary{{"a", 1}});
  ASSERT_TRUE(collector.waitForRequests(2));
  EXPECT_EQ(receivedEvents(collector).at(1).string("_productFamily"), "Kasten");
}

TEST_F(SessionTest, SendsTheDevicesFactsInTheStartRecordOfAnInternalBuild) {
  root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                            {"httpsPostURL", collector.url("/events")},
                                            {"environmentType", 4}});
  root.setDevice({{"DeviceName", "Kasten"}, {"ReleaseType", "Internal"}, {"SerialNumber", "QX1234"}});
  TestDaemon daemon(root);
  const auto session = startedSession(daemon, sessionInfo(1));  // Its stop record would be posted too.
  ASSERT_TRUE(collector.waitForRequests(1));
  const auto start = receivedEvents(collector).at(0);
  EXPECT_EQ(start.string("SerialNum"), "QX1234");
  EXPECT_EQ(start.string("Product"), "Kasten");
  EXPECT_EQ(start.string("ReportVers"), "7.0");
  EXPECT_EQ(collector.requests()[0].header("X-RTC-Internal-Build"), "1");
}

TEST_F(SessionTest, PostsOverOneReusedConnectionThroughARealProxyWithTLSAndHTTP2) {
  const NginxProxy proxy(loopbackIdentity(storebags.authority()), collector.port());
  postTo(proxy.url("/events"));
  TestDaemon daemon(root);
  auto session = startedSession(daemon, sessionInfo(1));
  constexpr std::size_t kMessages = 30;
  for (std::size_t i = 0; i < kMessages; ++i) {
    session->sendMessageSync(1, 0, Dictionary{{"i", static_cast<std::int64_t>(i)}});
  }
  ASSERT_TRUE(collector.waitForRequests(kMessages + 1));
  std::set<std::string> connections;
  for (const auto& request : collector.requests()) {
    connections.insert(request.header("X-Front-Connection").value_or(""));
    EXPECT_EQ(request.header("X-Front-Protocol"), "HTTP/2.0");
  }
  EXPECT_EQ(connections.size(), 1U);
}

TEST_F(SessionTest, LogsAPostThatFails) {
  postTo("http://127.0.0.1:1/events");
  TestDaemon daemon(root);
  startedSession(daemon, sessionInfo(1));
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<3>Tally(sendMessage) post error: "));
}

}  // namespace
}  // namespace tallyd::test
