// Sessions on the backends that the daemon itself makes.

#include "PostedEvents.h"
#include "SessionFixture.h"

namespace tallyd {
namespace {

class HTTPSPostSessionTest : public SessionFixture {
 protected:
  HTTPSPostSessionTest() {
    fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", true);
    fake.preferences.set("com.quillon.tally", "httpsPostURL", "https://post.test/in");
    delegate.storebag = Dictionary{{"splunk", profile()}};
    delegate.version = "bag 17";
  }

  /// Lets clients called "phone" report.
  static Dictionary profile() {
    return {{"clients", platform::Array({Dictionary{{"client", "phone"},
                                                    {"hierarchy", 2},
                                                    {"locale_whitelist", platform::Array({"DE"})},
                                                    {"filters", platform::Array()},
                                                    {"extras_on_internal", 1},
                                                    {"sampling_threshold", 1.0}}})}};
  }
  static Dictionary infoWith(std::string_view flag) {
    Dictionary info = sessionInfo();
    info.set(flag, true);
    return info;
  }
  std::shared_ptr<TallydSession> realSession(const Dictionary& info = sessionInfo(),
                                             const Info& user = std::nullopt) {
    auto session = std::make_shared<TallydSession>(delegate, platform, messageLog);
    configure(*session, info, user);
    startReally(*session);
    return session;
  }
  void startReally(TallydSession& session) {
    session.startConfigWithCompletionHandler([this](const auto& given) { states = given; });
  }
  TallydSession::Result send(TallydSession& session, const Dictionary& payload = {{"a", 1}}) {
    return session.sendMessageWithCategory(3, 4, payload);
  }
  std::vector<platform::HTTPRequest> posts() const { return fake.http.posts(); }
  std::vector<Dictionary> eventsOfPost(std::size_t index) const { return postedEvents(posts().at(index)); }

  std::optional<Names> states;
};

TEST_F(HTTPSPostSessionTest, TheStartRecordLeavesWithTheFirstState) {
  const auto session = realSession();
  EXPECT_EQ(states, Names{"splunk"});
  ASSERT_EQ(posts().size(), 1U);
  EXPECT_EQ(posts()[0].url, "https://post.test/in");
  const auto events = eventsOfPost(0);
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].string("_method"), "0");
  EXPECT_EQ(events[0].string("_status"), "0");
  EXPECT_EQ(events[0].string("_eventNumber"), "1");
  EXPECT_EQ(events[0].string("_sessionID"), kFirstKey);
  EXPECT_EQ(events[0].string("_sender"), "PH");
  EXPECT_EQ(events[0].string("_productFamily"), "Kasten");
  EXPECT_EQ(events[0].string("_reportVers"), "7.42");
  EXPECT_FALSE(events[0].contains("SerialNum"));
}

TEST_F(HTTPSPostSessionTest, TheStartRecordOfAnInternalBuildTellsOfTheDevice) {
  fake.device.answers["ReleaseType"] = "Internal";
  const auto session = realSession();
  const auto events = eventsOfPost(0);
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].string("SerialNum"), "QX1234");
  EXPECT_EQ(events[0].string("_internal"), "1");
}

TEST_F(HTTPSPostSessionTest, AClientThatConsentsHearsWhatWasPostedAndSoDoesTheMessageLog) {
  const auto session = realSession();
  const auto result = send(*session);
  ASSERT_EQ(posts().size(), 2U);
  EXPECT_EQ(result, postedJSON(posts()[1]));
  EXPECT_EQ(messageLogLines(), Texts{"[splunk -> sendMessageWithCategory] " + *result});
  const auto events = eventsOfPost(1);
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].integer("a"), 1);
  EXPECT_EQ(events[0].string("_method"), "3");
  EXPECT_EQ(events[0].string("_status"), "4");
  EXPECT_EQ(events[0].string("_eventNumber"), "2");
}

TEST_F(HTTPSPostSessionTest, AClientThatDoesNotConsentHearsNothing) {
  fake.preferences.values.erase("com.quillon.diagnostics/DiagnosticLogSubmissionEnabled");
  const auto session = realSession();
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_EQ(posts().size(), 2U);
  EXPECT_TRUE(messageLogLines().empty());
}

TEST_F(HTTPSPostSessionTest, ABatchLeavesWithAFlush) {
  const auto session = realSession(infoWith(kTallySessionInfoBatchEvent));
  EXPECT_EQ(states, Names{"splunk"});
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_TRUE(posts().empty());
  const auto result = session->flushMessages();
  ASSERT_EQ(posts().size(), 1U);
  EXPECT_EQ(result, postedJSON(posts()[0]));
  EXPECT_EQ(eventsOfPost(0).size(), 2U);
  EXPECT_EQ(messageLogLines(), Texts{"[splunk -> flushMessages] " + *result});
  EXPECT_EQ(session->flushMessages(), std::nullopt);
}

TEST_F(HTTPSPostSessionTest, TheEndFlushesTheBatchWithTheStopRecord) {
  auto session = realSession(infoWith(kTallySessionInfoBatchEvent));
  session->flushMessages();
  send(*session);
  session.reset();
  ASSERT_EQ(posts().size(), 2U);
  const auto events = eventsOfPost(1);
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(events[0].string("_method"), "3");
  EXPECT_EQ(events[1].string("_method"), "0");
  EXPECT_EQ(events[1].string("_status"), "1");
  EXPECT_EQ(events[1].string("StorebagVersion"), "bag 17");
  EXPECT_EQ(events[1].integer("Opt"), 0);
  EXPECT_EQ(events[1].integer("SamplingThreshold"), -1);
  EXPECT_TRUE(events[1].boolean("AutomaticTimeSet"));
}

TEST_F(HTTPSPostSessionTest, TheStopRecordCarriesNoVersionWhenThereIsNone) {
  delegate.version.reset();
  auto session = realSession();
  session.reset();
  ASSERT_EQ(posts().size(), 2U);
  EXPECT_FALSE(eventsOfPost(1).at(0).contains("StorebagVersion"));
  EXPECT_TRUE(eventsOfPost(1).at(0).contains("Opt"));
}

TEST_F(HTTPSPostSessionTest, ASecondStartPostsTheBatchThatTheFirstLeft) {
  const auto session = realSession(infoWith(kTallySessionInfoBatchEvent));
  send(*session);
  EXPECT_TRUE(posts().empty());
  fake.log.clear();
  startReally(*session);
  ASSERT_EQ(posts().size(), 1U);
  EXPECT_EQ(eventsOfPost(0).size(), 2U);
  EXPECT_TRUE(
      fake.log.has(platform::LogLevel::Debug, "dealloc: flush batched events, " + postedJSON(posts()[0])));
  // Of the first set nothing else leaves; the second one's start record waits in its own batch.
  session->flushMessages();
  ASSERT_EQ(posts().size(), 2U);
  EXPECT_EQ(eventsOfPost(1).size(), 1U);
  EXPECT_EQ(eventsOfPost(1)[0].string("_eventNumber"), "1");
}

TEST_F(HTTPSPostSessionTest, WhatLeavesWithADroppedBackendStillKnowsTheDevice) {
  fake.device.answers["ReleaseType"] = "Internal";
  Dictionary info = infoWith(kTallySessionInfoBatchEvent);
  info.set(kTallySessionInfoRequireUserInfo, true);
  auto session = realSession(info, userInfo("phone", "calls"));
  startReally(*session);
  session.reset();
  ASSERT_EQ(posts().size(), 2U);
  for (const auto& post : posts()) {
    EXPECT_EQ(postedDocument(post).string("clientId"), "0123456789abcdef0123456789abcdef01234567");
  }
}

TEST_F(HTTPSPostSessionTest, EventsWaitForTheRequiredUserInfo) {
  const auto session = realSession(infoWith(kTallySessionInfoRequireUserInfo));
  EXPECT_EQ(states, Names());
  EXPECT_EQ(session->getSessionHierarchy(), 0);
  EXPECT_EQ(send(*session), std::nullopt);
  session->receivedUserInfo(userInfo("unlisted", "calls"));
  EXPECT_TRUE(posts().empty());
  EXPECT_EQ(session->fetchReportingStates(), Names());

  session->receivedUserInfo(userInfo("phone", "calls"));
  EXPECT_EQ(session->fetchReportingStates(), Names{"splunk"});
  EXPECT_EQ(session->getSessionHierarchy(), 2);
  ASSERT_EQ(posts().size(), 1U);
  const auto events = eventsOfPost(0);
  ASSERT_EQ(events.size(), 2U);
  for (const auto& event : events) EXPECT_EQ(event.string(kTallyUserInfoClientName), "phone");
}

TEST_F(HTTPSPostSessionTest, EventsInABatchGetTheCombinedSessionIDOfTheParentThatIsFoundLater) {
  const auto session = realSession(infoWith(kTallySessionInfoBatchEvent));
  delegate.parent = "P";
  session->receivedUserInfo(userInfo("phone", "calls"));
  session->flushMessages();
  for (const auto& event : eventsOfPost(0)) {
    EXPECT_EQ(event.string("_sessionID"), std::string("P.") + kFirstKey);
  }
}

TEST_F(HTTPSPostSessionTest, AOneShotMessageIsPostedUnderTheClientsSessionID) {
  TallydSession::sendMessageWithSessionInfo(platform, messageLog, sessionInfo(), std::nullopt,
                                            delegate.storebag, 3, 4, Dictionary{{"a", 1}});
  ASSERT_EQ(posts().size(), 1U);
  const auto events = eventsOfPost(0);
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].string("_sessionID"), "7");
  EXPECT_EQ(events[0].string("_eventNumber"), "1");
  EXPECT_EQ(messageLogLines(), Texts{"[splunk -> sendMessageWithSessionInfo] " + postedJSON(posts()[0])});
}

TEST_F(HTTPSPostSessionTest, AOneShotMessageOfABatchingClientLeavesWhenItsBackendGoes) {
  TallydSession::sendMessageWithSessionInfo(platform, messageLog, infoWith(kTallySessionInfoBatchEvent),
                                            std::nullopt, delegate.storebag, 3, 4, Dictionary{{"a", 1}});
  ASSERT_EQ(posts().size(), 1U);
  EXPECT_EQ(eventsOfPost(0).size(), 1U);
  EXPECT_TRUE(messageLogLines().empty());
}

TEST_F(HTTPSPostSessionTest, AProfileThatTheBackendRefusesLeavesTheSetEmpty) {
  delegate.storebag = Dictionary{{"splunk", Dictionary()}};
  const auto session = realSession();
  EXPECT_EQ(states, Names());
  EXPECT_TRUE(
      fake.log.has(platform::LogLevel::Error, "Tally(HTTPSPostBackend): can't find the client list."));
  EXPECT_EQ(send(*session), std::nullopt);
  EXPECT_TRUE(posts().empty());
}

}  // namespace
}  // namespace tallyd
