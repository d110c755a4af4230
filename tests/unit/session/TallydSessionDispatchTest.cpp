#include "SessionFixture.h"

namespace tallyd {
namespace {

using Result = TallydSession::Result;

class TallydSessionDispatchTest : public SessionFixture {
 protected:
  Result send(TallydSession& session, std::uint16_t category = 3, std::uint16_t type = 4,
              const Info& payload = Dictionary{{"a", 1}}) {
    std::vector<Result> results;
    session.sendMessageWithCategory(category, type, payload,
                                    [&](const Result& result) { results.push_back(result); });
    EXPECT_EQ(results.size(), 1U);
    return results.at(0);
  }
  Result flush(TallydSession& session) {
    std::vector<Result> results;
    session.flushMessagesWithReply([&](const Result& result) { results.push_back(result); });
    EXPECT_EQ(results.size(), 1U);
    return results.at(0);
  }
  bool uploadFile(TallydSession& session, const std::string& url = "file:///tmp/a%20b.log") {
    std::vector<bool> results;
    session.uploadFileAtPath(url, "token", [&](bool uploaded) { results.push_back(uploaded); });
    EXPECT_EQ(results.size(), 1U);
    return results.at(0);
  }
  bool uploadLogData(TallydSession& session, const platform::Array& logData = platform::Array({"x", 5})) {
    std::vector<bool> results;
    session.uploadLogData(logData, [&](bool uploaded, const Result& error) {
      results.push_back(uploaded);
      EXPECT_EQ(error, std::nullopt);
    });
    EXPECT_EQ(results.size(), 1U);
    return results.at(0);
  }
};

TEST_F(TallydSessionDispatchTest, EveryBackendGetsTheMessageUnchanged) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  const auto session = startedSession();
  const timeval now = fake.clock.timeOfDay();
  send(*session, 65'535, 256, Dictionary{{"key", "value"}});
  ASSERT_EQ(backends.messages.size(), 2U);
  for (const auto& message : backends.messages) {
    EXPECT_EQ(message.method, 65'535);
    EXPECT_EQ(message.respCode, 256);
    EXPECT_EQ(message.payload, (Dictionary{{"key", "value"}}));
    EXPECT_EQ(message.timestamp.tv_sec, now.tv_sec);
    EXPECT_EQ(message.timestamp.tv_usec, now.tv_usec);
    EXPECT_EQ(message.eventID, 2);
  }
  EXPECT_EQ(lines(), Lines{debug("Sending message for session 7")});
}

TEST_F(TallydSessionDispatchTest, AMissingPayloadStaysMissingAndAnEmptyOneStaysEmpty) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  send(*session, 1, 2, std::nullopt);
  send(*session, 1, 2, Dictionary());
  ASSERT_EQ(backends.messages.size(), 2U);
  EXPECT_EQ(backends.messages[0].payload, std::nullopt);
  EXPECT_EQ(backends.messages[1].payload, Dictionary());
}

TEST_F(TallydSessionDispatchTest, TheClientHearsTheHTTPSPostBackendFirst) {
  backends.scripts = {{"dashboard", {.sent = "d", .flushed = "D"}},
                      {"splunk", {.sent = "s", .flushed = "S"}}};
  const auto session = startedSession();
  EXPECT_EQ(send(*session), "s");
  EXPECT_EQ(flush(*session), "S");
}

TEST_F(TallydSessionDispatchTest, TheClientHearsTheDashboardWhenTheHTTPSPostBackendIsSilent) {
  backends.scripts = {{"dashboard", {.sent = "d", .flushed = "D"}}, {"splunk", {}}};
  const auto session = startedSession();
  EXPECT_EQ(send(*session), "d");
  EXPECT_EQ(flush(*session), "D");
}

TEST_F(TallydSessionDispatchTest, WhoIsHeardDependsOnTheBackendsNamesAndNotOnTheirOrder) {
  backends.scripts = {{"dashboard", {.sent = "d", .flushed = "D"}},
                      {"splunk", {.sent = "s", .flushed = "S"}}};
  backends.names = {{"first", "splunk"}, {"second", "dashboard"}};
  const auto session = makeSession();
  configure(*session);
  session->createBackendsWithStorebag({{"first", Dictionary()}, {"second", Dictionary()}});
  EXPECT_EQ(send(*session), "s");
  EXPECT_EQ(flush(*session), "S");
  backends.scripts["splunk"] = {};
  EXPECT_EQ(send(*session), "d");
  EXPECT_EQ(flush(*session), "D");
}

TEST_F(TallydSessionDispatchTest, TheClientHearsNothingWhenBothAreSilent) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  const auto session = startedSession();
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_EQ(flush(*session), std::nullopt);
}

TEST_F(TallydSessionDispatchTest, AnEmptyTextIsAnAnswerToo) {
  backends.scripts = {{"dashboard", {.sent = "d", .flushed = "D"}}, {"splunk", {.sent = "", .flushed = ""}}};
  const auto session = startedSession();
  EXPECT_EQ(send(*session), "");
  EXPECT_EQ(flush(*session), "");
}

TEST_F(TallydSessionDispatchTest, TheClientNeverHearsOtherBackendsThoughTheMessageLogDoes) {
  backends.scripts = {{"https_post", {.sent = "h", .flushed = "H"}},
                      {"pith", {}},
                      {"power", {.sent = "p", .flushed = "P"}},
                      {"zebra", {.sent = "z", .flushed = "Z"}}};
  const auto session = startedSession();
  const Texts before = messageLogLines();
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_EQ(flush(*session), std::nullopt);
  const Texts after = messageLogLines();
  EXPECT_EQ(Texts(after.begin() + static_cast<std::ptrdiff_t>(before.size()), after.end()),
            (Texts{"[https_post -> sendMessageWithCategory] h", "[power -> sendMessageWithCategory] p",
                   "[zebra -> sendMessageWithCategory] z", "[https_post -> flushMessages] H",
                   "[power -> flushMessages] P", "[zebra -> flushMessages] Z"}));
}

TEST_F(TallydSessionDispatchTest, AMessageAndAFlushWithoutBackendsReplyNothing) {
  const auto session = makeSession();
  configure(*session);
  fake.log.clear();
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_EQ(
      lines(),
      (Lines{debug("Sending message for session 7"), debug("No backends available to send message"),
             debug("Flushing messages for session 7"), debug("No backends available to send message")}));
  EXPECT_TRUE(messageLogLines().empty());
}

TEST_F(TallydSessionDispatchTest, AMessageToAnEmptySetRepliesNothingWithoutALine) {
  delegate.storebag = Dictionary();
  const auto session = startedSession();
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_EQ(lines(),
            (Lines{debug("Sending message for session 7"), debug("Flushing messages for session 7")}));
}

TEST_F(TallydSessionDispatchTest, AFlushReachesEveryBackendOnce) {
  backends.scripts = {{"dashboard", {}}, {"pith", {}}, {"splunk", {}}};
  const auto session = startedSession();
  flush(*session);
  EXPECT_EQ(backends.trace, (Texts{"dashboard: flush", "pith: flush", "splunk: flush"}));
  EXPECT_EQ(lines(), Lines{debug("Flushing messages for session 7")});
}

TEST_F(TallydSessionDispatchTest, AnInternalMessageWithoutBackendsDoesNothingAtAll) {
  const auto session = makeSession();
  fake.log.clear();
  session->internalSendMessage(Dictionary(), fake.clock.timeOfDay(), 9, 8);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(TallydSessionDispatchTest, AnInternalMessageIsLoggedOncePerBackendBehindItsResult) {
  backends.scripts = {{"dashboard", {.sent = "d"}}, {"splunk", {}}};
  const auto session = startedSession();
  session->internalSendMessage(Dictionary(), fake.clock.timeOfDay(), 9, 65'535);
  EXPECT_EQ(backends.trace, (Texts{"dashboard: message 9/65535", "splunk: message 9/65535"}));
  const auto line = debug("Sent internal message (method:9 respCode:65535)");
  EXPECT_EQ(lines(), (Lines{line, line}));
  EXPECT_EQ(messageLogLines().back(), "[dashboard -> internalSendMessage] d");
}

TEST_F(TallydSessionDispatchTest, AFileIsOfferedToEveryBackendAndOneSuccessIsEnough) {
  backends.scripts = {{"a", {.uploadsFiles = true}}, {"b", {}}, {"c", {.uploadsFiles = true}}};
  const auto session = startedSession();
  EXPECT_TRUE(uploadFile(*session));
  EXPECT_EQ(backends.trace, (Texts{"a: file /tmp/a b.log token", "b: file /tmp/a b.log token",
                                   "c: file /tmp/a b.log token"}));
  EXPECT_EQ(lines(),
            (Lines{debug("Uploading file for session 7"), debug("File upload successful for /tmp/a b.log")}));
  EXPECT_EQ(messageLogLines(), Texts{"[uploadFileWithURL] Upload succeeded for file file:///tmp/a%20b.log"});
}

TEST_F(TallydSessionDispatchTest, ALateSuccessCountsToo) {
  backends.scripts = {{"a", {}}, {"b", {.uploadsFiles = true, .uploadsLogData = true}}};
  const auto session = startedSession();
  EXPECT_TRUE(uploadFile(*session));
  EXPECT_TRUE(uploadLogData(*session));
}

TEST_F(TallydSessionDispatchTest, AFileThatNoBackendSendsHasFailed) {
  backends.scripts = {{"a", {}}, {"b", {}}};
  const auto session = startedSession();
  EXPECT_FALSE(uploadFile(*session));
  EXPECT_EQ(backends.trace.size(), 2U);
  EXPECT_EQ(lines(),
            (Lines{debug("Uploading file for session 7"), critical("File upload failed for /tmp/a b.log")}));
  EXPECT_EQ(messageLogLines(), Texts{"[uploadFileWithURL] Upload failed for file file:///tmp/a%20b.log"});
}

TEST_F(TallydSessionDispatchTest, AFileWithoutBackendsHasFailed) {
  const auto session = makeSession();
  fake.log.clear();
  EXPECT_FALSE(uploadFile(*session, "/tmp/plain"));
  EXPECT_EQ(lines(),
            (Lines{debug("Uploading file for session 0"), critical("File upload failed for /tmp/plain")}));
  EXPECT_EQ(messageLogLines(), Texts{"[uploadFileWithURL] Upload failed for file /tmp/plain"});
}

TEST_F(TallydSessionDispatchTest, LogDataIsOfferedToEveryBackendAndOneSuccessIsEnough) {
  backends.scripts = {{"a", {.uploadsLogData = true}}, {"b", {}}};
  const auto session = startedSession();
  EXPECT_TRUE(uploadLogData(*session));
  EXPECT_EQ(backends.trace, (Texts{"a: log data (x, 5)", "b: log data (x, 5)"}));
  EXPECT_EQ(lines(), (Lines{debug("TallydSession: Uploading log data array: (x, 5)"),
                            debug("Log data array upload successful")}));
  EXPECT_TRUE(messageLogLines().empty());
}

TEST_F(TallydSessionDispatchTest, LogDataThatNoBackendTakesHasFailed) {
  backends.scripts["a"];
  const auto session = startedSession();
  EXPECT_FALSE(uploadLogData(*session));
  EXPECT_EQ(lines(), (Lines{debug("TallydSession: Uploading log data array: (x, 5)"),
                            critical("Log data array upload failed")}));
}

TEST_F(TallydSessionDispatchTest, LogDataWithoutBackendsHasFailed) {
  const auto session = makeSession();
  fake.log.clear();
  EXPECT_FALSE(uploadLogData(*session, platform::Array()));
  EXPECT_EQ(lines(), (Lines{debug("TallydSession: Uploading log data array: ()"),
                            critical("Log data array upload failed")}));
}

}  // namespace
}  // namespace tallyd
