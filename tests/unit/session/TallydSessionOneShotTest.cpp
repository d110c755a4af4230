// Messages that bring their session info along.

#include "SessionFixture.h"

namespace tallyd {
namespace {

class TallydSessionOneShotTest : public SessionFixture {
 protected:
  void sendOnce(TallydSession& session, const Info& info, const Info& user = std::nullopt,
                const Info& payload = Dictionary{{"a", 1}}) {
    session.sendMessageWithSessionInfo(info, user, 300, 400, payload,
                                       [this](const std::string& reply) { replies.push_back(reply); });
  }
  /// The operation that belongs to no session.
  void sendAlone(const Info& info, const Info& user, const Info& storebag) {
    TallydSession::sendMessageWithSessionInfo(platform, messageLog, info, user, storebag, 300, 400,
                                              Dictionary{{"a", 1}}, backends.factory());
  }
};

TEST_F(TallydSessionOneShotTest, EachBackendIsUpdatedThenSentToAndAllAreCleanedUpInASecondPass) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  forget();
  sendOnce(*session, sessionInfo());
  EXPECT_EQ(replies, Texts{"finished"});
  ASSERT_EQ(backends.trace.size(), 8U);
  EXPECT_EQ(Texts(backends.trace.begin(), backends.trace.begin() + 6),
            (Texts{"dashboard: update", "dashboard: message 300/400", "splunk: update",
                   "splunk: message 300/400", "dashboard: cleanup", "splunk: cleanup"}));
  EXPECT_TRUE(backends.trace[6].ends_with(": end"));
  EXPECT_TRUE(backends.trace[7].ends_with(": end"));
  EXPECT_EQ(delegate.asked, Texts{"storebag of session 7"});
  EXPECT_EQ(lines(), (Lines{debug("Received nil user info for session 7"),
                            debug("Sending message with session info for session 7"),
                            debug("TallydSession: Sending single message with sessionID 7")}));
}

TEST_F(TallydSessionOneShotTest, TheMessageIsTheBackendsFirstAndHasNoCombinedSessionID) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  const timeval now = fake.clock.timeOfDay();
  sendOnce(*session, sessionInfo(), std::nullopt, std::nullopt);
  ASSERT_EQ(backends.messages.size(), 1U);
  EXPECT_EQ(backends.messages[0].eventID, 1);
  EXPECT_EQ(backends.messages[0].payload, std::nullopt);
  EXPECT_EQ(backends.messages[0].combinedSessionID, std::nullopt);
  EXPECT_EQ(backends.messages[0].timestamp.tv_sec, now.tv_sec);
  EXPECT_EQ(backends.messages[0].timestamp.tv_usec, now.tv_usec);
}

TEST_F(TallydSessionOneShotTest, AllBackendsGetOneTimeOfDay) {
  backends.scripts = {{"a", {}}, {"b", {}}};
  backends.whenAsked = [this] { fake.clock.advance(std::chrono::seconds(1)); };
  sendAlone(sessionInfo(), std::nullopt, backends.storebag());
  ASSERT_EQ(backends.messages.size(), 2U);
  EXPECT_EQ(backends.messages[0].timestamp.tv_sec, fake.clock.timeOfDay().tv_sec);
  EXPECT_EQ(backends.messages[1].timestamp.tv_sec, fake.clock.timeOfDay().tv_sec);
}

TEST_F(TallydSessionOneShotTest, WithoutItsIdentifiersItIsNeverReplied) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  const Dictionary withoutID{{std::string(kTallySessionInfoClientType), 5}};
  const Dictionary withoutType{{std::string(kTallySessionInfoSessionID), 9}};
  for (const Info& info : {Info(withoutID), Info(withoutType), Info(Dictionary()), Info()}) {
    forget();
    sendOnce(*session, info, userInfo("phone", "calls"));
    EXPECT_TRUE(replies.empty());
    EXPECT_TRUE(delegate.asked.empty());
    EXPECT_TRUE(backends.trace.empty());
    EXPECT_EQ(lines(), Lines{critical("Could not retrieve identifiers from sessionInfo")});
    EXPECT_EQ(session->sessionID(), 0U);
    EXPECT_EQ(session->sessionInfo(), std::nullopt);
    EXPECT_EQ(session->userInfo(), std::nullopt);
  }
}

TEST_F(TallydSessionOneShotTest, WithoutAStorebagItSaysSo) {
  const auto session = makeSession();
  forget();
  sendOnce(*session, sessionInfo());
  EXPECT_EQ(replies, Texts{"storebag not available"});
  EXPECT_EQ(lines(), (Lines{debug("Received nil user info for session 7"),
                            debug("Sending message with session info for session 7")}));
}

TEST_F(TallydSessionOneShotTest, WithoutAReplyItDoesAllItsWork) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  session->sendMessageWithSessionInfo(sessionInfo(), std::nullopt, 1, 2, Dictionary(), {});
  EXPECT_EQ(backends.messages.size(), 1U);
  delegate.storebag.reset();
  session->sendMessageWithSessionInfo(sessionInfo(), std::nullopt, 1, 2, Dictionary(), {});
  EXPECT_EQ(backends.messages.size(), 1U);
}

TEST_F(TallydSessionOneShotTest, ItSetsTheSessionsInfoAndUserInfo) {
  delegate.storebag = Dictionary();
  const auto session = makeSession();
  forget();
  sendOnce(*session, sessionInfo(11), userInfo("phone", "calls"));
  EXPECT_EQ(session->sessionID(), 11U);
  EXPECT_EQ(session->sessionInfo(), sessionInfo(11));
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(delegate.asked,
            (Texts{"user info of session 11", "parent of session 11", "storebag of session 11"}));
}

TEST_F(TallydSessionOneShotTest, ItNeitherUsesNorChangesTheSessionsBackends) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  const std::weak_ptr<ScriptedBackend> own = backends.latest["splunk"];
  sendOnce(*session, sessionInfo());
  EXPECT_FALSE(own.expired());
  EXPECT_EQ(own.lock()->eventID(), 1);
  EXPECT_TRUE(backends.latest["splunk"].expired());
  EXPECT_EQ(session->fetchReportingStates(), Names{"splunk"});
}

TEST_F(TallydSessionOneShotTest, UserInfoThatIsNotRequiredIsUsedAfterAWarningWithAFullStop) {
  backends.scripts["splunk"];
  sendAlone(sessionInfo(), userInfo("phone", "calls"), backends.storebag());
  EXPECT_EQ(backends.messages.size(), 1U);
  EXPECT_EQ(lines(),
            (Lines{debug("TallydSession: Sending single message with sessionID 7"),
                   warning("sendMessageWithSessionInfo: user info provided without requiring it.")}));
}

TEST_F(TallydSessionOneShotTest, UserInfoThatIsRequiredBringsNoWarning) {
  backends.scripts["splunk"];
  Dictionary info = sessionInfo();
  info.set(kTallySessionInfoRequireUserInfo, true);
  sendAlone(info, userInfo("phone", "calls"), backends.storebag());
  EXPECT_EQ(lines(), Lines{debug("TallydSession: Sending single message with sessionID 7")});
}

TEST_F(TallydSessionOneShotTest, MissingParametersSendNothing) {
  backends.scripts["splunk"];
  sendAlone(sessionInfo(), std::nullopt, std::nullopt);
  sendAlone(std::nullopt, std::nullopt, backends.storebag());
  EXPECT_TRUE(backends.requests.empty());
  const auto missing = critical("TallydSession: Attempted to send message with one or more nil parameters");
  EXPECT_EQ(lines(), (Lines{debug("TallydSession: Sending single message with sessionID 7"), missing,
                            debug("TallydSession: Sending single message with sessionID 0"), missing}));
}

TEST_F(TallydSessionOneShotTest, AnEmptySetSendsNothingAndLogsNothingMore) {
  sendAlone(sessionInfo(), std::nullopt, Dictionary{{"unknown", Dictionary()}});
  EXPECT_EQ(lines(), Lines{debug("TallydSession: Sending single message with sessionID 7")});
  EXPECT_TRUE(messageLogLines().empty());
}

TEST_F(TallydSessionOneShotTest, AnEmptySetStillWarnsOfUserInfo) {
  sendAlone(sessionInfo(), userInfo("phone", "calls"), Dictionary());
  EXPECT_EQ(lines(),
            (Lines{debug("TallydSession: Sending single message with sessionID 7"),
                   warning("sendMessageWithSessionInfo: user info provided without requiring it.")}));
}

TEST_F(TallydSessionOneShotTest, TheSessionIDIsLoggedAsASignedNumber) {
  sendAlone(sessionInfo(-3), std::nullopt, Dictionary());
  sendAlone(sessionInfo(4'294'967'295), std::nullopt, Dictionary());
  EXPECT_EQ(lines(), (Lines{debug("TallydSession: Sending single message with sessionID -3"),
                            debug("TallydSession: Sending single message with sessionID 4294967295")}));
}

TEST_F(TallydSessionOneShotTest, WhatBackendsReportGoesToTheMessageLogAndNotToTheClient) {
  backends.scripts = {{"pith", {.sent = "p"}}, {"power", {}}, {"splunk", {.sent = "s", .flushed = "S"}}};
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  sendOnce(*session, sessionInfo());
  EXPECT_EQ(replies, Texts{"finished"});
  EXPECT_EQ(messageLogLines(),
            (Texts{"[pith -> sendMessageWithSessionInfo] p", "[splunk -> sendMessageWithSessionInfo] s"}));
}

}  // namespace
}  // namespace tallyd
