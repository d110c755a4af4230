#include "backends/https-post/HTTPSPostBackend.h"

#include "HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

using platform::Date;
using platform::Value;

class HTTPSPostBackendTest : public HTTPSPostBackendFixture {
 protected:
  std::shared_ptr<HTTPSPostBackend> made(const Payload& profile,
                                         const std::optional<std::string>& family = "Kasten") {
    return HTTPSPostBackend::initWithName(fake.platform, "splunk", profile, family);
  }
  /// A backend that needs no user info and posts each message.
  std::shared_ptr<HTTPSPostBackend> direct() {
    auto backend = pending();
    backend->setRequireUserInfo(false);
    backend->updateState();
    return backend;
  }
};

// Making one

TEST_F(HTTPSPostBackendTest, IsRefusedQuietlyWithoutProfileOrProductFamily) {
  EXPECT_EQ(made(std::nullopt), nullptr);
  EXPECT_EQ(made(Dictionary{{"clients", Array()}}, std::nullopt), nullptr);
  EXPECT_EQ(made(Dictionary(), std::nullopt), nullptr);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(HTTPSPostBackendTest, IsRefusedWithAnErrorLineWithoutAClientList) {
  const Dictionary profiles[] = {
      {}, {{"client", Array()}}, {{"clients", "Alpha"}}, {{"clients", Dictionary()}}};
  for (const Dictionary& profile : profiles) {
    fake.log.clear();
    EXPECT_EQ(made(profile), nullptr);
    EXPECT_EQ(fake.log.lines(),
              (Lines{{Level::Error, "Tally(HTTPSPostBackend): can't find the client list."}}));
  }
}

TEST_F(HTTPSPostBackendTest, StartsPendingWithTheDefaultLimitAndNoURL) {
  const auto backend = made(Dictionary{{"clients", Array()}, {"display_url", "https://show.example/"}});
  ASSERT_NE(backend, nullptr);
  EXPECT_EQ(backend->state(), ReportingStatePending);
  EXPECT_EQ(backend->eventThreshold(), 49);
  EXPECT_EQ(backend->dnuType(), DNUTypeConsent);
  EXPECT_EQ(backend->postURL(), std::nullopt);
  EXPECT_EQ(backend->displayURL(), "https://show.example/");
  EXPECT_EQ(backend->batchedEventCount(), 0U);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(HTTPSPostBackendTest, TakesThePreferredURLAtTheStart) {
  fake.preferences.set("com.quillon.tally", "httpsPostURL", "https://preferred.example/");
  EXPECT_EQ(made(Dictionary{{"clients", Array()}})->postURL(), "https://preferred.example/");
  EXPECT_EQ(fake.log.lines(),
            (Lines{{Level::Debug, "Using user default 'https://preferred.example/' for postURL"}}));
}

TEST_F(HTTPSPostBackendTest, PassesOverADisplayURLAndAPreferredURLThatAreNoText) {
  fake.preferences.set("com.quillon.tally", "httpsPostURL", 5);
  const auto backend = made(Dictionary{{"clients", Array()}, {"display_url", 7}});
  EXPECT_EQ(backend->displayURL(), std::nullopt);
  EXPECT_EQ(backend->postURL(), std::nullopt);
}

// Messages

TEST_F(HTTPSPostBackendTest, PostsAWholeRecordForAMessage) {
  const auto backend = direct();
  fake.locale.offset = std::chrono::seconds(-12'600);
  backend->sendMessage(Dictionary{{"bitrate", 500}}, kEventTime, 3, 4);
  EXPECT_EQ(lastEvent(), (Dictionary{{"_startTS", "1768478400"},
                                     {"_sender", "DH"},
                                     {"_clientVersion", "12"},
                                     {"_sessionID", "77"},
                                     {"_eventNumber", "1"},
                                     {"_method", "3"},
                                     {"_status", "4"},
                                     {"_clientTS", "1768478401.250"},
                                     {"eventTime", "1768478401.250"},
                                     {"_productFamily", "Kasten"},
                                     {"_productModel", "Kasten3,1"},
                                     {"_osVersion", "12.4"},
                                     {"_build", "12D500"},
                                     {"_internal", "0"},
                                     {"_reportVers", "7.42"},
                                     {"_timezoneOffset", -12'600},
                                     {"bitrate", 500}}));
}

TEST_F(HTTPSPostBackendTest, PostsARecordWithoutTheFactsThatTheDeviceDoesNotKnow) {
  const auto backend = direct();
  backend->setProductVersion(std::nullopt);
  backend->setBuildVersion(std::nullopt);
  backend->setHardwareType(std::nullopt);
  backend->setCompType(12);
  backend->sendMessage(std::nullopt, kEventTime, 3, 4);
  const Dictionary event = lastEvent();
  for (const char* key : {"_osVersion", "_build", "_productModel"}) EXPECT_FALSE(event.contains(key)) << key;
  EXPECT_EQ(event.string("_productFamily"), "Kasten");
  EXPECT_EQ(event.string("_sender"), "");
}

TEST_F(HTTPSPostBackendTest, NamesTheSessionByItsCombinedIDOnceThereIsOne) {
  const auto backend = direct();
  backend->setSessionID(4'294'967'295U);
  backend->sendMessage(std::nullopt, kEventTime, 3, 4);
  EXPECT_EQ(lastEvent().string("_sessionID"), "4294967295");
  backend->setCombinedSessionIDString("parent.child");
  backend->sendMessage(std::nullopt, kEventTime, 3, 4);
  EXPECT_EQ(lastEvent().string("_sessionID"), "parent.child");
  EXPECT_EQ(lastEvent().string("_eventNumber"), "2");
}

TEST_F(HTTPSPostBackendTest, TracesStateBatchingAndUserInfoOfEachMessage) {
  const auto backend = direct();
  backend->sendMessage(std::nullopt, kEventTime, 3, 4);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "Tally (sendMessage): 2, 0, 0"}}));
  fake.log.clear();
  backend->setRequireUserInfo(true);
  backend->setBatchEvents(true);
  backend->setState(ReportingStatePending);
  backend->sendMessage(std::nullopt, kEventTime, 3, 4);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "Tally (sendMessage): 0, 1, 1"}}));
  backend->setBatchEvents(false);
}

TEST_F(HTTPSPostBackendTest, DropsMessagesSilentlyWhenItIsOff) {
  const auto backend = direct();
  backend->setState(ReportingStateOff);
  EXPECT_EQ(backend->sendMessage(std::nullopt, kEventTime, 0, 1), std::nullopt);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(backend->batchedEventCount(), 0U);
  EXPECT_TRUE(lines().empty());
}

TEST_F(HTTPSPostBackendTest, LosesAFieldThatHoldsAnArrayBeforePosting) {
  direct()->sendMessage(Dictionary{{"samples", Array{1, 2}}, {"kept", "x"}, {"when", Date{12.5}}}, kEventTime,
                        3, 4);
  EXPECT_FALSE(lastEvent().contains("samples"));
  EXPECT_EQ(lastEvent().string("kept"), "x");
  EXPECT_EQ(lastEvent().string("when"), "12.500");
  EXPECT_TRUE(fake.log.has(Level::Warning,
                           "Tally: NSJSONSerialization unable to handle key: samples, value: (1, 2)"));
}

TEST_F(HTTPSPostBackendTest, MergesUserInfoOverTheEventAndFiltersIt) {
  const Array rules{Dictionary{{"key", "clientname"}, {"action", "sha256"}},
                    Dictionary{{"key", "_build"}, {"action", "remove"}}};
  Dictionary info = userInfo("beta");
  info.set("bitrate", "from user info");
  info.set("_sender", "overwritten");
  const auto backend = evaluated({entryWith("filters", rules)}, info);
  backend->sendMessage(Dictionary{{"bitrate", 500}}, kEventTime, 3, 4);
  const Dictionary event = lastEvent();
  EXPECT_EQ(event.string("bitrate"), "from user info");
  EXPECT_EQ(event.string("_sender"), "overwritten");
  // SHA-256 of "beta" by a command-line tool.
  EXPECT_EQ(event.string(kTallyUserInfoClientName),
            "f44e64e75f3948e9f73f8dfa94721c4ce8cbb4f265c4790c702b2d41cfbf2753");
  EXPECT_FALSE(event.contains("_build"));
}

TEST_F(HTTPSPostBackendTest, FiltersByTheMethodThatUserInfoOverwrote) {
  const Array rules{Dictionary{{"key", "token"}, {"method", 9}, {"action", "remove"}}};
  Dictionary info = userInfo();
  info.set("_method", 9);
  const auto backend = evaluated({entryWith("filters", rules)}, info);
  backend->sendMessage(Dictionary{{"token", "x"}}, kEventTime, 3, 4);
  EXPECT_FALSE(lastEvent().contains("token"));
}

// Stop messages

TEST_F(HTTPSPostBackendTest, AddsItsTermsToAStopMessageOfAnyCategory) {
  const auto backend = evaluated({entryWith("sampling_threshold", 0.75)});
  fake.log.clear();
  backend->sendMessage(Dictionary{{"reason", "done"}, {"Opt", "forged"}}, kEventTime, 3, 1);
  const Dictionary event = lastEvent();
  EXPECT_EQ(event.string("reason"), "done");
  EXPECT_EQ(*event.find("Opt"), Value(0));
  EXPECT_EQ(*event.find("SamplingThreshold"), Value(0.75));
  EXPECT_EQ(*event.find("AutomaticTimeSet"), Value(true));
  EXPECT_EQ(lines(),
            (Lines{{Level::Debug,
                    "HTTPSPostBackend: Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
                    "dictionary"},
                   {Level::Debug, "Tally (sendMessage): 2, 0, 1"}}));
}

TEST_F(HTTPSPostBackendTest, TellsMinusOneWithoutASamplingThreshold) {
  direct()->sendMessage(Dictionary(), kEventTime, 0, 1);
  EXPECT_EQ(*lastEvent().find("SamplingThreshold"), Value(-1));
}

TEST_F(HTTPSPostBackendTest, TellsTheOverrideInAStopMessage) {
  evaluated({entryWith("override_dnu", 1)})->sendMessage(Dictionary(), kEventTime, 0, 1);
  EXPECT_EQ(*lastEvent().find("Opt"), Value(2));
  setConsent(false);
  evaluated({entryWith("override_dnu", 1)})->sendMessage(Dictionary(), kEventTime, 0, 1);
  EXPECT_EQ(*lastEvent().find("Opt"), Value(1));
}

TEST_F(HTTPSPostBackendTest, TellsWhetherTheTimeIsSetAutomaticallyAsThePreferencesStand) {
  const auto backend = direct();
  const auto told = [&] {
    backend->sendMessage(Dictionary(), kEventTime, 0, 1);
    return *lastEvent().find("AutomaticTimeSet");
  };
  EXPECT_EQ(told(), Value(true));
  fake.preferences.set("com.quillon.timed", "TMAutomaticTimeZoneEnabled", false);
  EXPECT_EQ(told(), Value(false));
  fake.preferences.set("com.quillon.timed", "TMAutomaticTimeZoneEnabled", 1);
  EXPECT_EQ(told(), Value(true));
}

TEST_F(HTTPSPostBackendTest, SendsAStopMessageWithoutPayloadWithoutItsThreeFields) {
  const auto backend = direct();
  backend->sendMessage(std::nullopt, kEventTime, 0, 1);
  const Dictionary event = lastEvent();
  for (const char* key : {"Opt", "SamplingThreshold", "AutomaticTimeSet"}) {
    EXPECT_FALSE(event.contains(key)) << key;
  }
  EXPECT_EQ(event.string("_status"), "1");
  EXPECT_EQ(lines(),
            (Lines{{Level::Debug,
                    "HTTPSPostBackend: Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
                    "dictionary"},
                   {Level::Critical, "HTTPSPostBackend: SESSION_TYPE_STOP message dictionary is nil"},
                   {Level::Debug, "Tally (sendMessage): 2, 0, 0"}}));
}

TEST_F(HTTPSPostBackendTest, AddsNothingToOtherMessages) {
  const auto backend = direct();
  for (const int type : {0, 2, 65'535}) {
    backend->sendMessage(Dictionary(), kEventTime, 0, static_cast<std::uint16_t>(type));
    EXPECT_FALSE(lastEvent().contains("Opt")) << type;
  }
}

}  // namespace
}  // namespace tallyd
