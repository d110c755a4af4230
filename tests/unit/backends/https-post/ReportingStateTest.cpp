#include <gmock/gmock.h>

#include "HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

using platform::Value;

/// Everything that an evaluation may leave behind, as far as it shows.
struct Left {
  std::int32_t state;
  std::int32_t hierarchy;
  std::int32_t dnuType;
  std::int32_t eventThreshold;
  std::string postURL;
  Value samplingThreshold;  ///< As stop messages tell it.
  std::string filteredKey;  ///< The key that the rules in force remove.
  bool extras;              ///< Whether the device ID is the client identifier.
  bool operator==(const Left&) const = default;
};

std::ostream& operator<<(std::ostream& out, const Left& left) {
  return out << "state " << left.state << ", hierarchy " << left.hierarchy << ", dnuType " << left.dnuType
             << ", eventThreshold " << left.eventThreshold << ", postURL " << left.postURL
             << ", samplingThreshold " << left.samplingThreshold.description() << ", filteredKey "
             << left.filteredKey << ", extras " << left.extras;
}

class ReportingStateTest : public HTTPSPostBackendFixture {
 protected:
  static Dictionary removing(std::string_view key) { return {{"key", key}, {"action", "remove"}}; }

  /// What client "first" gets: every value set, none a default.
  static Dictionary firstEntry() {
    return {{"client", "first"},
            {"hierarchy", 11},
            {"override_dnu", 1},
            {"locale_whitelist", Array{"DE"}},
            {"filters", Array{removing("keyOfFirst")}},
            {"sampling_threshold", 0.75},
            {"event_threshold", 5},
            {"extras_on_internal", 1},
            {"post_url", "https://first.example/"}};
  }
  /// What client "second" gets: every value another one.
  static Dictionary secondEntry() {
    return {{"client", "second"},
            {"hierarchy", 22},
            {"locale_whitelist", Array{"DE"}},
            {"filters", Array{removing("keyOfSecond")}},
            {"sampling_threshold", 0.625},
            {"event_threshold", 6},
            {"extras_on_internal", 0},
            {"post_url", "https://second.example/"}};
  }
  static Left leftByFirst() {
    return {ReportingStateOn,         11,   DNUTypeOverrideConsent, 5,
            "https://first.example/", 0.75, "keyOfFirst",           true};
  }

  std::shared_ptr<HTTPSPostBackend> afterFirst(const Dictionary& second) {
    auto backend = evaluated({firstEntry(), second}, userInfo("first"));
    backend->setIsInternal(true);
    EXPECT_EQ(observed(*backend), leftByFirst());
    fake.log.clear();
    return backend;
  }
  /// Evaluates for client "second" after client "first".
  Left leftBySecond(const Dictionary& second) {
    const auto backend = afterFirst(second);
    backend->setUserInfoDict(userInfo("second"));
    backend->updateState();
    return observed(*backend);
  }

  /// Posts a stop message to see what is in force; leaves the log as it was.
  Left observed(HTTPSPostBackend& backend) {
    Left left{backend.state(),
              backend.hierarchy(),
              backend.dnuType(),
              backend.eventThreshold(),
              backend.postURL().value_or("nothing"),
              {},
              {},
              false};
    evaluationLines = lines();
    const Payload info = backend.userInfoDict();
    if (!info) backend.setUserInfoDict(userInfo());
    backend.setState(ReportingStateOn);
    backend.sendMessage(Dictionary{{"keyOfFirst", 1}, {"keyOfSecond", 1}}, kEventTime, 0, 1);
    backend.setState(left.state);
    backend.setUserInfoDict(info);
    const Dictionary event = lastEvent();
    left.samplingThreshold = event.contains("SamplingThreshold") ? *event.find("SamplingThreshold") : Value();
    for (const char* key : {"keyOfFirst", "keyOfSecond"}) {
      if (!event.contains(key)) left.filteredKey += key;
    }
    left.extras = lastBody().string("clientId") == kUdid;
    return left;
  }

  Lines evaluationLines;  ///< What was logged before the last look.
};

// The end of an evaluation, and what it leaves

TEST_F(ReportingStateTest, IsOnWithoutALookAtTheStorebagWhenUserInfoIsNotRequired) {
  const auto backend = pending({firstEntry()});
  backend->setRequireUserInfo(false);
  backend->setIsInternal(true);
  backend->setUserInfoDict(userInfo("first"));
  backend->updateState();
  EXPECT_EQ(observed(*backend), (Left{ReportingStateOn, 0, DNUTypeConsent, 49, "nothing", -1, "", false}));
  EXPECT_TRUE(evaluationLines.empty());
  EXPECT_EQ(lastPost().url, "");
}

TEST_F(ReportingStateTest, ChangesNothingWhenUserInfoIsNoLongerRequired) {
  const auto backend = afterFirst(secondEntry());
  backend->setUserInfoDict(userInfo("second"));
  backend->setRequireUserInfo(false);
  backend->updateState();
  EXPECT_EQ(observed(*backend), leftByFirst());
  EXPECT_TRUE(evaluationLines.empty());
}

TEST_F(ReportingStateTest, IsPendingAndElseUnchangedWithoutUserInfo) {
  const auto backend = afterFirst(secondEntry());
  backend->setUserInfoDict(std::nullopt);
  backend->updateState();
  Left expected = leftByFirst();
  expected.state = ReportingStatePending;
  EXPECT_EQ(observed(*backend), expected);
  EXPECT_TRUE(evaluationLines.empty());
}

TEST_F(ReportingStateTest, IsPendingAndElseUnchangedWithoutAMatchingEntry) {
  const auto backend = afterFirst(secondEntry());
  backend->setUserInfoDict(userInfo("third"));
  backend->updateState();
  Left expected = leftByFirst();
  expected.state = ReportingStatePending;
  EXPECT_EQ(observed(*backend), expected);
  EXPECT_TRUE(evaluationLines.empty());
}

TEST_F(ReportingStateTest, IsPendingWithAnEmptyClientList) {
  EXPECT_EQ(evaluated(Array())->state(), ReportingStatePending);
  EXPECT_TRUE(lines().empty());
}

TEST_F(ReportingStateTest, IsOffWithoutConsentAndTakesHierarchyAndTermsOnly) {
  setConsent(false);
  Dictionary second = secondEntry();
  second.set("override_dnu", 2);
  const auto backend = evaluated({firstEntry(), second}, userInfo("first"));
  EXPECT_EQ(backend->dnuType(), DNUTypeOverrideNoConsent);
  backend->setIsInternal(true);
  fake.log.clear();
  backend->setUserInfoDict(userInfo("second"));
  backend->updateState();
  Left expected = leftByFirst();
  expected.state = ReportingStateOff;
  expected.hierarchy = 22;
  expected.dnuType = DNUTypeConsent;
  EXPECT_EQ(observed(*backend), expected);
  EXPECT_EQ(evaluationLines,
            (Lines{{Level::Debug, "Tally(updateBackendState): reporting disabled by DNU: 2."}}));
}

TEST_F(ReportingStateTest, NamesAMissingOverrideZero) {
  setConsent(false);
  EXPECT_EQ(evaluated({secondEntry()}, userInfo("second"))->state(), ReportingStateOff);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "Tally(updateBackendState): reporting disabled by DNU: 0."}}));
}

TEST_F(ReportingStateTest, IsOffOutsideTheLocaleListAndTakesHierarchyAndTermsOnly) {
  Dictionary second = secondEntry();
  second.set("locale_whitelist", Array{"FR", "US"});
  Left expected = leftByFirst();
  expected.state = ReportingStateOff;
  expected.hierarchy = 22;
  expected.dnuType = DNUTypeConsent;
  EXPECT_EQ(leftBySecond(second), expected);
  EXPECT_EQ(evaluationLines,
            (Lines{{Level::Debug, "Tally(updateBackendState): (DE) isn't in locale list (FR, US)"}}));
}

TEST_F(ReportingStateTest, IsOffWithoutALocaleList) {
  EXPECT_EQ(evaluated({entryWithout("locale_whitelist")})->state(), ReportingStateOff);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "Tally(updateBackendState): (DE) isn't in locale list (null)"}}));
  fake.log.clear();
  fake.locale.country.reset();
  EXPECT_EQ(evaluated({entryWith("locale_whitelist", Array())})->state(), ReportingStateOff);
  EXPECT_EQ(lines(), (Lines{{Level::Debug, "Tally(updateBackendState): ((null)) isn't in locale list ()"}}));
}

TEST_F(ReportingStateTest, PassesTheLocaleCheckOnADeviceWithoutACountryCode) {
  fake.locale.country.reset();
  EXPECT_EQ(evaluated()->state(), ReportingStateOn);
}

TEST_F(ReportingStateTest, IsOffOutsideTheDeviceListAndTakesHierarchyAndTermsOnly) {
  Dictionary second = secondEntry();
  second.set("device_whitelist", Array{"Tafel", "Kastenwagen"});
  Left expected = leftByFirst();
  expected.state = ReportingStateOff;
  expected.hierarchy = 22;
  expected.dnuType = DNUTypeConsent;
  EXPECT_EQ(leftBySecond(second), expected);
  EXPECT_EQ(evaluationLines, (Lines{{Level::Debug,
                                     "Tally(updateBackendState): (Kasten) isn't in device list (Tafel, "
                                     "Kastenwagen)"}}));
}

TEST_F(ReportingStateTest, IsOffWithoutFiltersAndTakesHierarchyAndTermsOnly) {
  Dictionary second = secondEntry();
  second.remove("filters");
  Left expected = leftByFirst();
  expected.state = ReportingStateOff;
  expected.hierarchy = 22;
  expected.dnuType = DNUTypeConsent;
  EXPECT_EQ(leftBySecond(second), expected);
  EXPECT_EQ(evaluationLines, (Lines{{Level::Warning, "Tally(updateBackendState): filters are required."}}));
}

TEST_F(ReportingStateTest, KeepsEarlierRulesWithAnEmptyFilterListAndGoesOn) {
  Dictionary second = secondEntry();
  second.set("filters", Array());
  EXPECT_EQ(leftBySecond(second), (Left{ReportingStateOn, 22, DNUTypeConsent, 6, "https://second.example/",
                                        0.625, "keyOfFirst", false}));
}

TEST_F(ReportingStateTest, TakesEverythingWhenItIsOn) {
  EXPECT_EQ(leftBySecond(secondEntry()), (Left{ReportingStateOn, 22, DNUTypeConsent, 6,
                                               "https://second.example/", 0.625, "keyOfSecond", false}));
  EXPECT_EQ(evaluationLines,
            (Lines{{Level::Debug, "HTTPSPostBackend(updateBackendState): event_threshold set to 6"},
                   {Level::Debug, "HTTPSPostBackend(updateBackendState): extras on internal is set to 0"},
                   {Level::Debug, "Tally (updateBackendState): client found second, state? 2, 0.500000"},
                   {Level::Debug, "Defaulting to 'https://second.example/' for postURL"}}));
}

TEST_F(ReportingStateTest, IsOffWhenNotSampledAndTakesEverythingAllTheSame) {
  Dictionary second = secondEntry();
  second.set("sampling_threshold", 0.25);
  EXPECT_EQ(leftBySecond(second), (Left{ReportingStateOff, 22, DNUTypeConsent, 6, "https://second.example/",
                                        0.25, "keyOfSecond", false}));
  EXPECT_THAT(evaluationLines,
              testing::Contains(fakes::FakeLog::Line{
                  Level::Debug, "Tally (updateBackendState): client found second, state? 1, 0.500000"}));
}

TEST_F(ReportingStateTest, IsOffWithoutASamplingThresholdAndTakesEverythingAllTheSame) {
  Dictionary second = secondEntry();
  second.remove("sampling_threshold");
  EXPECT_EQ(leftBySecond(second), (Left{ReportingStateOff, 22, DNUTypeConsent, 6, "https://second.example/",
                                        -1, "keyOfSecond", false}));
  EXPECT_EQ(evaluationLines,
            (Lines{{Level::Debug, "HTTPSPostBackend(updateBackendState): event_threshold set to 6"},
                   {Level::Debug, "HTTPSPostBackend(updateBackendState): extras on internal is set to 0"},
                   {Level::Debug, "Tally (updateBackendState): client found second, state? 1, 0.500000"},
                   {Level::Debug, "Defaulting to 'https://second.example/' for postURL"}}));
}

TEST_F(ReportingStateTest, KeepsWhatTheEntryDoesNotGive) {
  Dictionary second = secondEntry();
  for (const char* key : {"hierarchy", "event_threshold", "extras_on_internal", "post_url"})
    second.remove(key);
  EXPECT_EQ(leftBySecond(second), (Left{ReportingStateOn, 0, DNUTypeConsent, 5, "https://first.example/",
                                        0.625, "keyOfSecond", true}));
  EXPECT_EQ(evaluationLines,
            (Lines{{Level::Debug,
                    "HTTPSPostBackend(updateBackendState): event_threshold value not found in storebag - "
                    "defaulting to 49"},
                   {Level::Debug, "Tally (updateBackendState): client found second, state? 2, 0.500000"}}));
}

TEST_F(ReportingStateTest, NamesAnEntryForAnyClientAsNothing) {
  Dictionary entry = secondEntry();
  entry.remove("client");
  fake.randomness.draws = {0.0625};
  evaluated({entry});
  EXPECT_TRUE(
      fake.log.has(Level::Debug, "Tally (updateBackendState): client found (null), state? 2, 0.062500"));
}

TEST_F(ReportingStateTest, MovesBetweenItsStatesInEveryDirection) {
  const auto backend = evaluated();
  std::vector<std::int32_t> states{backend->state()};
  const auto evaluate = [&] {
    backend->updateState();
    states.push_back(backend->state());
  };
  fake.locale.country = "FR";
  evaluate();
  backend->setUserInfoDict(std::nullopt);
  evaluate();
  fake.locale.country = "DE";
  backend->setUserInfoDict(userInfo());
  evaluate();
  backend->setUserInfoDict(userInfo("nobody"));
  evaluate();
  fake.locale.country = "FR";
  backend->setUserInfoDict(userInfo());
  evaluate();
  fake.locale.country = "DE";
  evaluate();
  EXPECT_EQ(states, (std::vector<std::int32_t>{2, 1, 0, 2, 0, 1, 2}));
}

// Consent

TEST_F(ReportingStateTest, ReturnsNoDocumentForAnOverrideWithConsent) {
  const auto backend = evaluated({entryWith("override_dnu", 1)});
  EXPECT_EQ(backend->dnuType(), DNUTypeOverrideConsent);
  EXPECT_EQ(backend->sendMessage(std::nullopt, kEventTime, 3, 4), std::nullopt);
  EXPECT_EQ(postCount(), 1U);
}

TEST_F(ReportingStateTest, ReportsWithoutConsentWhenTheStorebagOverridesIt) {
  setConsent(false);
  const auto backend = evaluated({entryWith("override_dnu", 1)});
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(backend->dnuType(), DNUTypeOverrideNoConsent);
}

// Where it posts

TEST_F(ReportingStateTest, PrefersThePreferencesURLAndReadsItAnew) {
  const auto backend = evaluated();
  EXPECT_EQ(backend->postURL(), kURL);
  fake.preferences.set("com.quillon.tally", "httpsPostURL", "https://preferred.example/");
  fake.log.clear();
  backend->updateState();
  EXPECT_EQ(backend->postURL(), "https://preferred.example/");
  EXPECT_EQ(
      lines().back(),
      (fakes::FakeLog::Line{Level::Debug, "Using user default 'https://preferred.example/' for postURL"}));
  fake.preferences.values.erase("com.quillon.tally/httpsPostURL");
  backend->updateState();
  EXPECT_EQ(backend->postURL(), kURL);
  EXPECT_EQ(lines().back(),
            (fakes::FakeLog::Line{Level::Debug, "Defaulting to 'https://collect.example/post' for postURL"}));
}

TEST_F(ReportingStateTest, ReadsThePreferencesURLAnewOnlyWhereTheStorebagHasOne) {
  const auto backend = evaluated({entryWithout("post_url")});
  fake.preferences.set("com.quillon.tally", "httpsPostURL", "https://preferred.example/");
  backend->updateState();
  EXPECT_EQ(backend->postURL(), std::nullopt);
}

// Sampling

TEST_F(ReportingStateTest, ReportsForAFactorUpToTheThreshold) {
  const std::tuple<double, double, std::int32_t> cases[] = {
      {0.25, 0.25, ReportingStateOn}, {0.2500001, 0.25, ReportingStateOff}, {0, 0, ReportingStateOn},
      {1e-9, 0, ReportingStateOff},   {0.999999, 1, ReportingStateOn},      {0.999999, 7.5, ReportingStateOn},
      {0, -0.5, ReportingStateOff}};
  for (const auto& [factor, threshold, state] : cases) {
    fake.randomness.draws = {factor};
    EXPECT_EQ(evaluated({entryWith("sampling_threshold", threshold)})->state(), state)
        << factor << " of " << threshold;
  }
}

TEST_F(ReportingStateTest, DecidesForALifeTime) {
  fake.randomness.draws = {0.3};
  const auto backend = evaluated({entryWith("sampling_threshold", 0.3)});
  for (int i = 0; i < 3; ++i) {
    backend->updateState();
    EXPECT_EQ(backend->state(), ReportingStateOn);
  }
}

}  // namespace
}  // namespace tallyd
