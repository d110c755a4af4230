#include "session/BackendSetup.h"

#include "SessionFixture.h"

namespace tallyd {
namespace {

class BackendSetupTest : public SessionFixture {
 protected:
  std::optional<BackendSet> create(const Info& storebag, const Info& info, const Info& user = std::nullopt) {
    return createBackendsFromStorebag(platform, storebag, info, user, deviceID, backends.factory());
  }
  /// The only backend of a set built from this session info.
  std::shared_ptr<TallyBackend> backendFor(const Dictionary& info, const Info& user = std::nullopt) {
    backends.scripts["splunk"];
    return create(backends.storebag(), info, user)->at("splunk");
  }

  const char* const deviceID = "0123456789abcdef0123456789abcdef01234567";
};

TEST_F(BackendSetupTest, WithoutAStorebagThereIsNoSet) {
  EXPECT_FALSE(create(std::nullopt, sessionInfo()));
  EXPECT_FALSE(create(std::nullopt, std::nullopt));
  const auto line = critical("Attempted to create backends with nil storebag");
  EXPECT_EQ(lines(), (Lines{line, line}));
}

TEST_F(BackendSetupTest, WithoutSessionInfoThereIsNoSet) {
  EXPECT_FALSE(create(Dictionary(), std::nullopt));
  EXPECT_EQ(lines(), Lines{critical("Attempted to create backends with nil session info")});
}

TEST_F(BackendSetupTest, AnEmptyStorebagGivesAnEmptySet) {
  const auto set = create(Dictionary(), Dictionary());
  ASSERT_TRUE(set);
  EXPECT_TRUE(set->empty());
  EXPECT_TRUE(lines().empty());
}

TEST_F(BackendSetupTest, EntriesThatMakeNoBackendAreSkippedSilently) {
  const Dictionary storebag{{"first", Dictionary()}, {"second", Dictionary()}};
  const auto set = create(storebag, sessionInfo());
  ASSERT_TRUE(set);
  EXPECT_TRUE(set->empty());
  EXPECT_EQ(backends.requests.size(), 2U);
  EXPECT_TRUE(lines().empty());
}

TEST_F(BackendSetupTest, TheFactoryOfTheDaemonSaysWhichNamesItDoesNotKnow) {
  const Dictionary storebag{{"Splunk", Dictionary()}, {"splunkk", Dictionary()}};
  const auto set = createBackendsFromStorebag(platform, storebag, sessionInfo(), std::nullopt, deviceID);
  ASSERT_TRUE(set);
  EXPECT_TRUE(set->empty());
  const auto unknown = [](std::string name) {
    return fakes::FakeLog::Line{platform::LogLevel::Error,
                                "TallyBackend(newBackendWithName): " + std::move(name)};
  };
  EXPECT_EQ(lines(), (Lines{unknown("Splunk"), unknown("splunkk")}));
}

TEST_F(BackendSetupTest, TheFactoryGetsNameProfileProductFamilyAndClientType) {
  const Dictionary profile{{"clients", platform::Array()}};
  (void)create(Dictionary{{"splunk", profile}, {"other", Dictionary()}}, sessionInfo());
  ASSERT_EQ(backends.requests.size(), 2U);
  EXPECT_EQ(backends.requests[0].name, "other");
  EXPECT_EQ(backends.requests[1].name, "splunk");
  EXPECT_EQ(backends.requests[1].profile, profile);
  EXPECT_EQ(backends.requests[1].productFamily, "Kasten");
  EXPECT_EQ(backends.requests[1].clientType, 5);
}

TEST_F(BackendSetupTest, AnEntryThatIsNoDictionaryIsOfferedWithoutProfileAfterALine) {
  (void)create(Dictionary{{"splunk", "not a profile"}}, sessionInfo());
  ASSERT_EQ(backends.requests.size(), 1U);
  EXPECT_EQ(backends.requests[0].profile, std::nullopt);
  EXPECT_EQ(lines(), (Lines{{platform::LogLevel::Error, "Storebag entry splunk is not a dictionary"}}));
}

TEST_F(BackendSetupTest, BackendsAreStampedWithSessionClientAndDevice) {
  Dictionary info = sessionInfo(12);
  info.set(kTallySessionInfoClientVersion, 513);
  info.set(kTallySessionInfoRequireUserInfo, true);
  info.set(kTallySessionInfoBatchEvent, true);
  const auto backend = backendFor(info, userInfo("phone", "calls"));
  EXPECT_EQ(backend->name(), "splunk");
  EXPECT_EQ(backend->sessionID(), 12U);
  EXPECT_EQ(backend->compType(), 5);
  EXPECT_EQ(backend->clientVersion(), 513);
  EXPECT_EQ(backend->udid(), deviceID);
  EXPECT_EQ(backend->productVersion(), "12.4");
  EXPECT_EQ(backend->buildVersion(), "12D500");
  EXPECT_EQ(backend->hardwareType(), "Kasten3,1");
  EXPECT_EQ(backend->productFamily(), "Kasten");
  EXPECT_FALSE(backend->isInternal());
  EXPECT_TRUE(backend->requireUserInfo());
  EXPECT_TRUE(backend->batchEvents());
  EXPECT_EQ(backend->userInfoDict(), userInfo("phone", "calls"));
  EXPECT_EQ(backend->selfVersionMajor(), 7);
  EXPECT_EQ(backend->selfVersionMinor(), 42);
  EXPECT_EQ(backend->startTimeStamp(), secondsFromTimeval(fake.clock.timeOfDay()));
  EXPECT_EQ(backend->state(), ReportingStatePending);
}

TEST_F(BackendSetupTest, MissingSessionInfoKeysReadAsZeroAndFalse) {
  const auto backend = backendFor(Dictionary());
  EXPECT_EQ(backend->sessionID(), 0U);
  EXPECT_EQ(backend->compType(), 0);
  EXPECT_EQ(backend->clientVersion(), 0);
  EXPECT_FALSE(backend->requireUserInfo());
  EXPECT_FALSE(backend->batchEvents());
  EXPECT_EQ(backend->userInfoDict(), std::nullopt);
}

TEST_F(BackendSetupTest, OnlyTheLowSixteenBitsOfTheClientVersionCount) {
  const std::pair<std::int64_t, int> table[] = {{65'537, 1}, {65'535, 65'535}, {65'536, 0}, {-1, 65'535}};
  for (const auto& [given, taken] : table) {
    EXPECT_EQ(backendFor(Dictionary{{std::string(kTallySessionInfoClientVersion), given}})->clientVersion(),
              taken);
  }
}

TEST_F(BackendSetupTest, MissingDevicePropertiesAreMissingFromTheBackends) {
  fake.device.answers.clear();
  const auto backend = backendFor(sessionInfo());
  EXPECT_EQ(backend->productVersion(), std::nullopt);
  EXPECT_EQ(backend->buildVersion(), std::nullopt);
  EXPECT_EQ(backend->hardwareType(), std::nullopt);
  EXPECT_EQ(backend->productFamily(), std::nullopt);
}

TEST_F(BackendSetupTest, DevicePropertiesAreAskedAnewOnEveryBuild) {
  EXPECT_EQ(backendFor(sessionInfo())->productVersion(), "12.4");
  fake.device.answers["ProductVersion"] = "12.5";
  EXPECT_EQ(backendFor(sessionInfo())->productVersion(), "12.5");
}

TEST_F(BackendSetupTest, TheInternalBuildFlagIsDecidedOnce) {
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_TRUE(backendFor(sessionInfo())->isInternal());
  fake.device.answers.erase("ReleaseType");
  EXPECT_TRUE(backendFor(sessionInfo())->isInternal());
}

TEST_F(BackendSetupTest, WithoutABundleVersionTheReportingVersionIsTheDefault) {
  fake.frameworkBundle.info.remove("CFBundleVersion");
  const auto backend = backendFor(sessionInfo());
  EXPECT_EQ(backend->selfVersionMajor(), 6);
  EXPECT_EQ(backend->selfVersionMinor(), 21);
}

TEST_F(BackendSetupTest, AllBackendsOfOneSetShareOneStartTimestamp) {
  backends.scripts = {{"dashboard", {}}, {"pith", {}}, {"splunk", {}}};
  backends.whenAsked = [this] { fake.clock.advance(std::chrono::seconds(1)); };
  const double start = secondsFromTimeval(fake.clock.timeOfDay());
  const auto set = create(backends.storebag(), sessionInfo());
  ASSERT_EQ(set->size(), 3U);
  for (const auto& [name, backend] : *set) EXPECT_EQ(backend->startTimeStamp(), start) << name;
}

/// The record that a session's start sends to its backends.
class StartRecordTest : public SessionFixture {
 protected:
  ScriptedBackends::Message startRecord() {
    backends.scripts["splunk"];
    delegate.storebag = backends.storebag();
    const auto session = makeSession();
    configure(*session);
    session->startConfigWithCompletionHandler({});
    return backends.messages.at(0);
  }
};

TEST_F(StartRecordTest, HasNoPayloadOnACustomerBuild) {
  const auto record = startRecord();
  EXPECT_EQ(record.payload, std::nullopt);
  EXPECT_EQ(record.method, 0);
  EXPECT_EQ(record.respCode, 0);
  EXPECT_EQ(record.eventID, 1);
}

TEST_F(StartRecordTest, HasExactlySixKeysOnAnInternalBuild) {
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_EQ(startRecord().payload, (Dictionary{{"SerialNum", "QX1234"},
                                               {"Version", "12.4"},
                                               {"Build", "12D500"},
                                               {"Hardware", "K31AP"},
                                               {"Product", "Kasten"},
                                               {"ReportVers", "7.42.1"}}));
}

TEST_F(StartRecordTest, SaysUnknownForWhatTheDeviceDoesNotAnswer) {
  fake.device.answers = {{"ReleaseType", "Internal"}};
  fake.frameworkBundle.info.remove("CFBundleVersion");
  EXPECT_EQ(startRecord().payload, (Dictionary{{"SerialNum", "Unknown"},
                                               {"Version", "Unknown"},
                                               {"Build", "Unknown"},
                                               {"Hardware", "Unknown"},
                                               {"Product", "Unknown"},
                                               {"ReportVers", "6.21"}}));
}

TEST_F(StartRecordTest, CarriesTheTimeBeforeTheBackendsWereBuilt) {
  backends.whenAsked = [this] { fake.clock.advance(std::chrono::seconds(3)); };
  const timeval before = fake.clock.timeOfDay();
  const auto record = startRecord();
  EXPECT_EQ(record.timestamp.tv_sec, before.tv_sec);
  EXPECT_EQ(record.timestamp.tv_usec, before.tv_usec);
}

TEST_F(StartRecordTest, FindsTheCombinedSessionIDInTheBackend) {
  EXPECT_EQ(startRecord().combinedSessionID, kFirstKey);
}

TEST_F(StartRecordTest, GoesToNoBackendOfAnEmptySet) {
  delegate.storebag = Dictionary();
  const auto session = makeSession();
  configure(*session);
  forget();
  std::vector<std::optional<Names>> states;
  session->startConfigWithCompletionHandler([&](const auto& given) { states.push_back(given); });
  ASSERT_EQ(states.size(), 1U);
  EXPECT_EQ(states[0], Names());
  EXPECT_EQ(lines(),
            (Lines{debug("Starting configuration for session 7"), debug("Creating backends for session 7"),
                   debug("Received nil user info for session 7")}));
}

TEST_F(StartRecordTest, WritesOneLinePerBackendAndWhatItReportsToTheMessageLog) {
  backends.scripts = {{"dashboard", {.sent = "d"}}, {"pith", {}}, {"splunk", {.sent = "s"}}};
  delegate.storebag = backends.storebag();
  const auto session = makeSession();
  configure(*session);
  session->startConfigWithCompletionHandler({});
  EXPECT_EQ(fake.log.count(platform::LogLevel::Debug, "Sent internal message (method:0 respCode:0)"), 3U);
  EXPECT_EQ(messageLogLines(),
            (Texts{"[dashboard -> internalSendMessage] d", "[splunk -> internalSendMessage] s"}));
}

TEST_F(StartRecordTest, BackendsOfASessionGetItsDeviceID) {
  backends.scripts["splunk"];
  const auto session = startedSession();
  EXPECT_STREQ(backends.latest["splunk"].lock()->udid(), "0123456789abcdef0123456789abcdef01234567");
}

TEST_F(StartRecordTest, BackendsOfASessionOnADeviceWithoutIDGetAnEmptyOne) {
  fake.device.answers.erase("UniqueDeviceID");
  backends.scripts["splunk"];
  const auto session = startedSession();
  EXPECT_STREQ(backends.latest["splunk"].lock()->udid(), "");
}

}  // namespace
}  // namespace tallyd
