#include "SessionFixture.h"

namespace tallyd {
namespace {

class TallydSessionUserInfoTest : public SessionFixture {
 protected:
  std::string displayURL(TallydSession& session) {
    Texts urls;
    session.fetchDisplayURL([&](const std::string& url) { urls.push_back(url); });
    EXPECT_EQ(urls.size(), 1U);
    return urls.at(0);
  }
  std::size_t timesTold() const {
    return static_cast<std::size_t>(
        std::count_if(delegate.asked.begin(), delegate.asked.end(),
                      [](const std::string& text) { return text.starts_with("user info of"); }));
  }
};

TEST_F(TallydSessionUserInfoTest, TheFirstUserInfoIsAcceptedEvenWithoutNames) {
  for (const Dictionary& first : {Dictionary(), Dictionary{{"other", 1}}}) {
    forget();
    const auto session = makeSession();
    session->receivedUserInfo(first);
    EXPECT_EQ(session->userInfo(), first);
    EXPECT_EQ(timesTold(), 1U);
  }
}

TEST_F(TallydSessionUserInfoTest, TheSameNamesWithAnotherThirdKeyAreNotAccepted) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  forget();
  Dictionary again = userInfo("phone", "calls");
  again.set("third", "new");
  session->receivedUserInfo(again);
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(backends.latest["splunk"].lock()->userInfoDict(), userInfo("phone", "calls"));
  EXPECT_EQ(delegate.asked, Texts{"parent of session 7"});
  EXPECT_EQ(backends.trace, (Texts{"splunk: update", std::string("splunk: correlate ") + kFirstKey}));
}

TEST_F(TallydSessionUserInfoTest, AnotherClientNameOrServiceNameIsAccepted) {
  const auto session = makeSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  session->receivedUserInfo(userInfo("tablet", "calls"));
  EXPECT_EQ(session->userInfo(), userInfo("tablet", "calls"));
  session->receivedUserInfo(userInfo("tablet", "video"));
  EXPECT_EQ(session->userInfo(), userInfo("tablet", "video"));
  EXPECT_EQ(timesTold(), 3U);
}

TEST_F(TallydSessionUserInfoTest, NamesAreComparedWithRegardToCase) {
  const auto session = makeSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  session->receivedUserInfo(userInfo("Phone", "calls"));
  EXPECT_EQ(session->userInfo(), userInfo("Phone", "calls"));
  EXPECT_EQ(timesTold(), 2U);
}

TEST_F(TallydSessionUserInfoTest, AMissingNameCountsAsChangedEveryTime) {
  const auto session = makeSession();
  const Dictionary clientOnly{{std::string(kTallyUserInfoClientName), "phone"}};
  session->receivedUserInfo(clientOnly);
  session->receivedUserInfo(clientOnly);
  EXPECT_EQ(timesTold(), 2U);
  session->receivedUserInfo(Dictionary());
  EXPECT_EQ(session->userInfo(), Dictionary());
  EXPECT_EQ(timesTold(), 3U);
}

TEST_F(TallydSessionUserInfoTest, ANameThatIsNoTextCountsAsMissing) {
  const auto session = makeSession();
  const Dictionary numbers{{std::string(kTallyUserInfoClientName), 5},
                           {std::string(kTallyUserInfoServiceName), 6}};
  session->receivedUserInfo(numbers);
  session->receivedUserInfo(numbers);
  EXPECT_EQ(timesTold(), 2U);
}

TEST_F(TallydSessionUserInfoTest, MissingUserInfoOnlyRefreshesTheStates) {
  backends.scripts["splunk"];
  delegate.parent = "P";
  const auto session = startedSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  const std::string combined = session->combinedSessionIDString();
  forget();
  session->receivedUserInfo(std::nullopt);
  EXPECT_EQ(session->userInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(session->combinedSessionIDString(), combined);
  EXPECT_TRUE(delegate.asked.empty());
  EXPECT_EQ(backends.trace, Texts{"splunk: update"});
  EXPECT_EQ(backends.latest["splunk"].lock()->combinedSessionIDString(), combined);
  EXPECT_EQ(lines(), Lines{debug("Received nil user info for session 7")});
}

TEST_F(TallydSessionUserInfoTest, StatesAreUpdatedBetweenTheTwoQuestionsToTheAgent) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  // The hierarchy that the parent's search goes by comes from the update.
  backends.scripts["splunk"].hierarchy = 3;
  EXPECT_EQ(session->getSessionHierarchy(), 0);
  session->receivedUserInfo(userInfo("phone", "calls"));
  EXPECT_EQ(session->getSessionHierarchy(), 3);
  EXPECT_EQ(delegate.asked, (Texts{"user info of session 7", "parent of session 7"}));
}

TEST_F(TallydSessionUserInfoTest, WithoutAParentTheCombinedSessionIDStaysAndIsStillHandedOut) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  const auto session = startedSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  EXPECT_EQ(session->combinedSessionIDString(), kFirstKey);
  EXPECT_EQ(backends.trace,
            (Texts{"dashboard: update", "splunk: update", std::string("dashboard: correlate ") + kFirstKey,
                   std::string("splunk: correlate ") + kFirstKey}));
  EXPECT_EQ(lines(),
            Lines{debug(std::string("Setting combined session ID '") + kFirstKey + "' for backends")});
}

TEST_F(TallydSessionUserInfoTest, EachCallThatFindsAParentPutsItInFrontOnceMore) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  delegate.parent = "P";
  const std::string key = kFirstKey;
  session->receivedUserInfo(userInfo("phone", "calls"));
  EXPECT_EQ(session->combinedSessionIDString(), "P." + key);
  session->receivedUserInfo(userInfo("phone", "calls"));
  EXPECT_EQ(session->combinedSessionIDString(), "P.P." + key);
  EXPECT_EQ(backends.trace, (Texts{"splunk: update", "splunk: correlate P." + key, "splunk: update",
                                   "splunk: correlate P.P." + key}));
  EXPECT_EQ(lines(), (Lines{debug("Setting combined session ID 'P." + key + "' for backends"),
                            debug("Setting combined session ID 'P.P." + key + "' for backends")}));
}

TEST_F(TallydSessionUserInfoTest, ConfigurationAndStartEachFindTheParent) {
  backends.scripts["splunk"];
  delegate.parent = "P";
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session, sessionInfo(), userInfo("phone", "calls"));
  EXPECT_EQ(session->combinedSessionIDString(), std::string("P.") + kFirstKey);
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(session->combinedSessionIDString(), std::string("P.P.") + kFirstKey);
  EXPECT_EQ(backends.messages.at(0).combinedSessionID, std::string("P.") + kFirstKey);
  EXPECT_EQ(backends.latest["splunk"].lock()->combinedSessionIDString(), std::string("P.P.") + kFirstKey);
}

TEST_F(TallydSessionUserInfoTest, AnUpdateHandsTheStoredUserInfoToEveryBackend) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  const auto session = startedSession();
  session->receivedUserInfo(userInfo("phone", "calls"));
  for (const char* name : {"dashboard", "splunk"}) {
    EXPECT_EQ(backends.latest[name].lock()->userInfoDict(), userInfo("phone", "calls"));
  }
}

TEST_F(TallydSessionUserInfoTest, WithoutBackendsAnUpdateDoesNothing) {
  const auto session = makeSession();
  fake.log.clear();
  session->updateReportingStates();
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(TallydSessionUserInfoTest, ReportingStatesAreNothingWithoutBackendsAndEmptyWhenNoneReports) {
  const auto session = makeSession();
  EXPECT_EQ(session->fetchReportingStates(), std::nullopt);
  backends.scripts = {{"dashboard", {.state = ReportingStateOff}},
                      {"splunk", {.state = ReportingStatePending}}};
  configure(*session);
  EXPECT_EQ(start(*session), Names());
  EXPECT_EQ(session->fetchReportingStates(), Names());
}

TEST_F(TallydSessionUserInfoTest, ReportingStatesFollowTheBackends) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {.state = ReportingStatePending}}};
  const auto session = startedSession();
  EXPECT_EQ(session->fetchReportingStates(), Names{"dashboard"});
  backends.scripts["dashboard"].state = ReportingStateOff;
  backends.scripts["splunk"].state = ReportingStateOn;
  session->updateReportingStates();
  EXPECT_EQ(session->fetchReportingStates(), Names{"splunk"});
}

TEST_F(TallydSessionUserInfoTest, TheHierarchyIsTheHTTPSPostBackendsAlone) {
  backends.scripts = {{"dashboard", {.hierarchy = 4}}, {"https_post", {.hierarchy = 5}}};
  const auto session = startedSession();
  EXPECT_EQ(session->getSessionHierarchy(), 0);
  backends.scripts["splunk"].hierarchy = -2;
  start(*session);
  EXPECT_EQ(session->getSessionHierarchy(), -2);
}

TEST_F(TallydSessionUserInfoTest, TheDisplayURLIsTheDashboardsWithTheSessionID) {
  backends.scripts["dashboard"].displayURL = "https://dashboard.test/show";
  const auto session = startedSession();
  EXPECT_EQ(displayURL(*session), "https://dashboard.test/show?sequences=7&override=yes");
  EXPECT_EQ(lines(), Lines{debug("Fetching display URL for session 7")});
}

TEST_F(TallydSessionUserInfoTest, ASessionIDAboveTheSignedRangeIsNegativeInTheDisplayURL) {
  backends.scripts["dashboard"].displayURL = "U";
  const auto session = makeSession();
  configure(*session, sessionInfo(4'294'967'295));
  start(*session);
  EXPECT_EQ(displayURL(*session), "U?sequences=-1&override=yes");
  session->setSessionID(2'147'483'648U);
  EXPECT_EQ(displayURL(*session), "U?sequences=-2147483648&override=yes");
  session->setSessionID(2'147'483'647U);
  EXPECT_EQ(displayURL(*session), "U?sequences=2147483647&override=yes");
}

TEST_F(TallydSessionUserInfoTest, WithoutADashboardOrItsURLThereIsNoDisplayURL) {
  const auto session = makeSession();
  configure(*session);
  fake.log.clear();
  EXPECT_EQ(displayURL(*session), "URL not available");
  EXPECT_EQ(lines(), Lines{debug("Fetching display URL for session 7")});
  backends.scripts["splunk"].displayURL = "https://not.the.dashboard";
  start(*session);
  EXPECT_EQ(displayURL(*session), "URL not available");
  backends.scripts["dashboard"];
  start(*session);
  EXPECT_EQ(displayURL(*session), "URL not available");
}

}  // namespace
}  // namespace tallyd
