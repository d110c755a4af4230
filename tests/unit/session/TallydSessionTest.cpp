// The life of a session: creation, configuration, start, end.

#include "session/TallydSession.h"

#include "SessionFixture.h"

namespace tallyd {
namespace {

class TallydSessionTest : public SessionFixture {
 protected:
  /// Texts of the trace that stand for no backend's end, whose order among each other is free.
  Texts traceWithoutEnds() const {
    Texts texts = backends.trace;
    std::erase_if(texts, [](const std::string& text) { return text.ends_with(": end"); });
    return texts;
  }
};

TEST_F(TallydSessionTest, AFreshSessionHasAKeyOfItsOwn) {
  const auto first = makeSession();
  const auto second = makeSession();
  EXPECT_EQ(first->combinedSessionIDString(), kFirstKey);
  for (const auto& session : {first, second}) {
    EXPECT_EQ(session->combinedSessionIDString().size(), 24U);
    EXPECT_TRUE(session->combinedSessionIDString().ends_with("=="));
  }
  EXPECT_NE(first->combinedSessionIDString(), second->combinedSessionIDString());
}

TEST_F(TallydSessionTest, AFreshSessionKnowsNothing) {
  const auto session = makeSession();
  EXPECT_EQ(session->sessionID(), 0U);
  EXPECT_EQ(session->sessionInfo(), std::nullopt);
  EXPECT_EQ(session->userInfo(), std::nullopt);
  EXPECT_EQ(session->getSessionHierarchy(), 0);
  EXPECT_TRUE(delegate.asked.empty());
}

TEST_F(TallydSessionTest, CreationLogsTheDelegateAndTheKey) {
  const auto session = makeSession();
  EXPECT_EQ(lines(), (Lines{debug("TallydSession initWithSessionDelegate:<FakeSessionDelegate>"),
                            debug(std::string("Initialized session with UUID ") + kFirstKey)}));
}

TEST_F(TallydSessionTest, ConfigurationTakesTheSessionIDAndReplies) {
  const auto session = makeSession();
  fake.log.clear();
  configure(*session);
  EXPECT_EQ(session->sessionID(), 7U);
  EXPECT_EQ(session->sessionInfo(), sessionInfo());
  EXPECT_EQ(replies, Texts{"received"});
  EXPECT_EQ(lines(), (Lines{debug("Configuring session 7"), debug("Received nil user info for session 7")}));
}

TEST_F(TallydSessionTest, ConfigurationWithAnEmptySessionInfoSetsSessionIDZeroAndReplies) {
  const auto session = makeSession();
  configure(*session);
  configure(*session, Dictionary());
  EXPECT_EQ(session->sessionID(), 0U);
  EXPECT_EQ(session->sessionInfo(), Dictionary());
  EXPECT_EQ(replies, (Texts{"received", "received"}));
}

TEST_F(TallydSessionTest, ConfigurationWithoutSessionInfoSetsSessionIDZeroAndReplies) {
  const auto session = makeSession();
  configure(*session);
  configure(*session, std::nullopt);
  EXPECT_EQ(session->sessionID(), 0U);
  EXPECT_EQ(session->sessionInfo(), std::nullopt);
  EXPECT_EQ(replies, (Texts{"received", "received"}));
}

TEST_F(TallydSessionTest, TheSessionIDIsReadAsUnsignedThirtyTwoBits) {
  const auto session = makeSession();
  const std::pair<platform::Value, std::uint32_t> table[] = {{4'294'967'295U, 4'294'967'295U},
                                                             {-1, 4'294'967'295U},
                                                             {std::int64_t{1} << 32, 0U},
                                                             {(std::int64_t{1} << 32) + 5, 5U},
                                                             {2.9, 2U},
                                                             {"12", 12U},
                                                             {true, 1U},
                                                             {platform::Array(), 0U}};
  for (const auto& [value, sessionID] : table) {
    configure(*session, Dictionary{{std::string(kTallySessionInfoSessionID), value}});
    EXPECT_EQ(session->sessionID(), sessionID) << value.description();
  }
}

TEST_F(TallydSessionTest, UserInfoThatIsNotRequiredIsUsedAfterAWarning) {
  const auto session = makeSession();
  fake.log.clear();
  configure(*session, sessionInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(lines(),
            (Lines{debug("Configuring session 7"),
                   warning("Configure session: user info provided without requiring it"),
                   debug(std::string("Setting combined session ID '") + kFirstKey + "' for backends")}));
}

TEST_F(TallydSessionTest, UserInfoThatIsRequiredBringsNoWarning) {
  const auto session = makeSession();
  fake.log.clear();
  Dictionary info = sessionInfo();
  info.set(kTallySessionInfoRequireUserInfo, true);
  configure(*session, info, userInfo("phone", "calls"));
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(lines(),
            (Lines{debug("Configuring session 7"),
                   debug(std::string("Setting combined session ID '") + kFirstKey + "' for backends")}));
}

TEST_F(TallydSessionTest, UserInfoWithoutSessionInfoIsUsedAfterAWarning) {
  const auto session = makeSession();
  configure(*session, std::nullopt, userInfo("phone", "calls"));
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Warning,
                           "Configure session: user info provided without requiring it"));
}

TEST_F(TallydSessionTest, ConfigurationFetchesNoStorebagAndBuildsNoBackend) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session);
  EXPECT_TRUE(delegate.asked.empty());
  EXPECT_TRUE(backends.requests.empty());
  EXPECT_EQ(session->fetchReportingStates(), std::nullopt);
}

TEST_F(TallydSessionTest, TheAgentIsToldOfUserInfoOnceTheSessionHoldsIt) {
  const auto session = makeSession();
  configure(*session, sessionInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(delegate.asked, (Texts{"user info of session 7", "parent of session 7"}));
  EXPECT_EQ(delegate.userInfoSeen, userInfo("phone", "calls"));
}

TEST_F(TallydSessionTest, StartBuildsTheBackendsAndNamesThoseThatReport) {
  backends.scripts["dashboard"];
  backends.scripts["pith"].state = ReportingStateOff;
  backends.scripts["power"].state = ReportingStatePending;
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session, sessionInfo(), userInfo("phone", "calls"));
  forget();
  std::vector<std::optional<Names>> states;
  session->startConfigWithCompletionHandler([&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], (Names{"dashboard", "splunk"}));
  EXPECT_EQ(delegate.asked, (Texts{"storebag of session 7", "parent of session 7"}));
}

TEST_F(TallydSessionTest, StartSendsTheStartRecordBeforeTheBackendsGetTheirState) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session, sessionInfo(), userInfo("phone", "calls"));
  forget();
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(backends.trace,
            (Texts{"splunk: message 0/0", "splunk: update", std::string("splunk: correlate ") + kFirstKey}));
  EXPECT_EQ(lines(),
            (Lines{debug("Starting configuration for session 7"), debug("Creating backends for session 7"),
                   debug("Sent internal message (method:0 respCode:0)"),
                   debug(std::string("Setting combined session ID '") + kFirstKey + "' for backends")}));
}

TEST_F(TallydSessionTest, StartWithoutUserInfoOnlyUpdatesTheStates) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session);
  forget();
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(backends.trace, (Texts{"splunk: message 0/0", "splunk: update"}));
  EXPECT_EQ(delegate.asked, Texts{"storebag of session 7"});
  EXPECT_EQ(lines().back(), debug("Received nil user info for session 7"));
}

TEST_F(TallydSessionTest, StartWithoutHandlerDoesAllItsWork) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session);
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(session->fetchReportingStates(), Names{"splunk"});
}

TEST_F(TallydSessionTest, StartWithoutStorebagGivesNothing) {
  const auto session = makeSession();
  configure(*session);
  forget();
  std::vector<std::optional<Names>> states;
  session->startConfigWithCompletionHandler([&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], std::nullopt);
  EXPECT_EQ(lines(), Lines{debug("Starting configuration for session 7")});

  forget();
  std::vector<TallydSession::Result> results;
  session->sendMessageWithCategory(1, 2, Dictionary(), [&](const auto& given) { results.push_back(given); });
  ASSERT_EQ(results.size(), 1U);
  EXPECT_EQ(results[0], std::nullopt);
  EXPECT_EQ(lines(),
            (Lines{debug("Sending message for session 7"), debug("No backends available to send message")}));
}

TEST_F(TallydSessionTest, ALaterStartMaySucceed) {
  backends.scripts["splunk"];
  const auto session = makeSession();
  configure(*session);
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(session->fetchReportingStates(), std::nullopt);
  EXPECT_EQ(start(*session), Names{"splunk"});
}

TEST_F(TallydSessionTest, AStartWithoutStorebagKeepsTheBackendsOfAnEarlierStart) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  delegate.storebag.reset();
  session->startConfigWithCompletionHandler([](const auto& states) { EXPECT_EQ(states, std::nullopt); });
  EXPECT_TRUE(backends.trace.empty());
  EXPECT_EQ(session->fetchReportingStates(), Names{"splunk"});
}

TEST_F(TallydSessionTest, StartBeforeAnyConfigurationLeavesTheSessionWithoutBackends) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  fake.log.clear();
  std::vector<std::optional<Names>> states;
  session->startConfigWithCompletionHandler([&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], std::nullopt);
  EXPECT_EQ(delegate.asked, Texts{"storebag of session 0"});
  EXPECT_TRUE(backends.requests.empty());
  EXPECT_EQ(lines(),
            (Lines{debug("Starting configuration for session 0"), debug("Creating backends for session 0"),
                   critical("Attempted to create backends with nil session info"),
                   debug("Received nil user info for session 0")}));
}

TEST_F(TallydSessionTest, ASecondStartDropsTheFirstBackendsWithoutFlushOrCleanup) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  const std::weak_ptr<ScriptedBackend> first = backends.latest["splunk"];
  session->startConfigWithCompletionHandler({});
  EXPECT_TRUE(first.expired());
  EXPECT_FALSE(backends.latest["splunk"].expired());
  EXPECT_EQ(backends.trace, (Texts{"splunk: end", "splunk: message 0/0", "splunk: update"}));
}

TEST_F(TallydSessionTest, FetchingStatesTakesUserInfoAndNamesTheBackendsThatReport) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  std::vector<std::optional<Names>> states;
  session->fetchStatesWithUserInfo(userInfo("phone", "calls"),
                                   [&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], Names{"splunk"});
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(lines(),
            (Lines{debug("Fetching states for session 7"),
                   debug(std::string("Setting combined session ID '") + kFirstKey + "' for backends")}));
}

TEST_F(TallydSessionTest, FetchingStatesWithoutBackendsGivesNothing) {
  const auto session = makeSession();
  std::vector<std::optional<Names>> states;
  session->fetchStatesWithUserInfo(std::nullopt, [&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], std::nullopt);
  EXPECT_EQ(lines().back(), debug("Received nil user info for session 0"));
}

TEST_F(TallydSessionTest, FetchingStatesWithoutHandlerDoesAllItsWork) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  session->fetchStatesWithUserInfo(userInfo("phone", "calls"), {});
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(backends.trace, (Texts{"splunk: update", std::string("splunk: correlate ") + kFirstKey}));
}

TEST_F(TallydSessionTest, TheEndSendsTheStopRecordThenFlushesThenCleansUp) {
  backends.scripts["dashboard"];
  backends.scripts["splunk"];
  delegate.version = "bag 17";
  auto session = startedSession();
  fake.clock.advance(std::chrono::seconds(2));
  const timeval now = fake.clock.timeOfDay();
  session.reset();
  EXPECT_EQ(traceWithoutEnds(), (Texts{"dashboard: message 0/1", "splunk: message 0/1", "dashboard: flush",
                                       "splunk: flush", "dashboard: cleanup", "splunk: cleanup"}));
  EXPECT_EQ(backends.trace.size(), 8U);
  EXPECT_TRUE(backends.trace[6].ends_with(": end"));
  EXPECT_TRUE(backends.trace[7].ends_with(": end"));
  ASSERT_EQ(backends.messages.size(), 2U);
  for (const auto& message : backends.messages) {
    EXPECT_EQ(message.payload, (Dictionary{{"StorebagVersion", "bag 17"}}));
    EXPECT_EQ(message.timestamp.tv_sec, now.tv_sec);
    EXPECT_EQ(message.timestamp.tv_usec, now.tv_usec);
    EXPECT_EQ(message.eventID, 2U);
  }
  EXPECT_EQ(delegate.asked, Texts{"storebag version of session 7"});
  EXPECT_EQ(lines(),
            (Lines{debug("TallydSession dealloc: 7"), debug("Sent internal message (method:0 respCode:1)"),
                   debug("Sent internal message (method:0 respCode:1)")}));
}

TEST_F(TallydSessionTest, WhatThrowsAtTheEndIsLeftOutAndTheRestIsDone) {
  const std::map<std::string, std::string> steps{
      {"message 0/1", "stop record"}, {"flush", "flush"}, {"cleanup", "clean-up"}};
  for (const auto& [operation, step] : steps) {
    backends.scripts["dashboard"].throwsAt = operation;
    backends.scripts["splunk"];
    startedSession().reset();
    EXPECT_EQ(traceWithoutEnds(), (Texts{"dashboard: message 0/1", "splunk: message 0/1", "dashboard: flush",
                                         "splunk: flush", "dashboard: cleanup", "splunk: cleanup"}));
    const std::string reason = std::bad_alloc().what();
    EXPECT_EQ(fake.log.count(platform::LogLevel::Critical,
                             "TallydSession: " + step + " of session 7 left out: " + reason),
              1U);
    forget();
  }
}

TEST_F(TallydSessionTest, TheStopRecordIsSentEvenWhenItIsEmpty) {
  backends.scripts["splunk"];
  auto session = startedSession();
  session.reset();
  ASSERT_EQ(backends.messages.size(), 1U);
  EXPECT_EQ(backends.messages[0].payload, Dictionary());
}

TEST_F(TallydSessionTest, ASessionThatWasNeverStartedStillAsksForTheStorebagVersion) {
  auto session = makeSession();
  forget();
  session.reset();
  EXPECT_EQ(delegate.asked, Texts{"storebag version of session 0"});
  EXPECT_TRUE(backends.trace.empty());
  EXPECT_EQ(lines(),
            (Lines{debug("TallydSession dealloc: 0"), debug("No backends available to send message")}));
}

TEST_F(TallydSessionTest, WhatBackendsReportAtTheEndGoesToTheMessageLog) {
  backends.scripts["splunk"] = {.sent = "stopped", .flushed = "flushed"};
  auto session = makeSession();
  configure(*session);
  start(*session);
  session.reset();
  EXPECT_EQ(messageLogLines(),
            (Texts{"[splunk -> internalSendMessage] stopped", "[splunk -> internalSendMessage] stopped",
                   "[splunk -> flushMessages] flushed"}));
}

TEST_F(TallydSessionTest, ItsDescriptionNamesItAndNoOther) {
  const auto first = makeSession();
  const auto second = makeSession();
  EXPECT_TRUE(first->description().starts_with("<TallydSession: 0x"));
  EXPECT_NE(first->description(), second->description());
}

}  // namespace
}  // namespace tallyd
