#include "backends/https-post/ReportingRules.h"

#include <gtest/gtest.h>
#include <unicode/uloc.h>

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

Dictionary entry(const char* client, const char* service) {
  return {{"client", client},
          {"service", service},
          {"locale_whitelist", Array{"DE"}},
          {"filters", Array()},
          {"sampling_threshold", 1}};
}

Dictionary userInfo(const char* client, const char* service = "VideoCallService") {
  return {{std::string(kTallyUserInfoClientName), client}, {std::string(kTallyUserInfoServiceName), service}};
}

ReportingCircumstances circumstances(const Array& clients, const Dictionary& info) {
  return {.profile = {{"clients", clients}},
          .requireUserInfo = true,
          .userInfo = info,
          .consented = true,
          .samplingFactor = 0.5,
          .productFamily = "Kasten",
          .countryCode = "DE"};
}

/// Whether an entry for this "client" text is chosen for the client name.
bool isChosen(const char* clients, const char* name) {
  Dictionary only = entry(clients, "");
  only.remove("service");
  return decideReporting(circumstances({only}, userInfo(name))).entry.has_value();
}

bool serviceIsChosen(const char* services, const char* name) {
  Dictionary only = entry("", services);
  only.remove("client");
  return decideReporting(circumstances({only}, userInfo("any", name))).entry.has_value();
}

// Matching

TEST(MatchListTest, AnswersTheFlagForAMissingOrEmptyList) {
  for (const bool flag : {true, false}) {
    for (const auto& list : {MatchList(), MatchList(std::vector<std::string_view>())}) {
      EXPECT_EQ(matchExactStringWithList(list, "x", flag), flag);
      EXPECT_EQ(matchStringWithList(list, "x", flag), flag);
      EXPECT_EQ(matchExactStringWithList(list, std::nullopt, flag), flag);
      EXPECT_EQ(matchStringWithList(list, std::nullopt, flag), flag);
    }
  }
}

TEST(MatchListTest, AnswersTheOppositeOfTheFlagForAMissingString) {
  const MatchList list{{"x"}};
  for (const bool flag : {true, false}) {
    EXPECT_EQ(matchExactStringWithList(list, std::nullopt, flag), !flag);
    EXPECT_EQ(matchStringWithList(list, std::nullopt, flag), !flag);
  }
}

TEST(MatchListTest, MatchesWholeStringsOrPartsWithoutRegardToTheFlag) {
  const MatchList list{{"nothing", "call"}};
  for (const bool flag : {true, false}) {
    EXPECT_TRUE(matchExactStringWithList(list, "CALL", flag));
    EXPECT_FALSE(matchExactStringWithList(list, "VideoCall", flag));
    EXPECT_TRUE(matchStringWithList(list, "VideoCallService", flag));
    EXPECT_FALSE(matchStringWithList(list, "cal", flag));
  }
}

TEST(MatchListTest, NeverMatchesAnEmptyElement) {
  const MatchList list{{"", ""}};
  EXPECT_FALSE(matchExactStringWithList(list, "", true));
  EXPECT_FALSE(matchStringWithList(list, "", true));
  EXPECT_FALSE(matchStringWithList(list, "x", true));
}

TEST(MatchListTest, FollowsUnicodeWithoutRegardToTheLocale) {
  const std::string before = uloc_getDefault();
  for (const char* locale : {"de_DE", "tr_TR", "az_AZ", "lt_LT"}) {
    UErrorCode status = U_ZERO_ERROR;
    uloc_setDefault(locale, &status);
    ASSERT_TRUE(U_SUCCESS(status));
    EXPECT_TRUE(matchExactStringWithList({{"ÄÖÜ"}}, "äöü", true)) << locale;
    EXPECT_TRUE(matchStringWithList({{"äö"}}, "xÄÖy", true)) << locale;
    EXPECT_TRUE(matchExactStringWithList({{"STRASSE"}}, "Straße", true)) << locale;
    EXPECT_TRUE(matchExactStringWithList({{"ΣΊΣΥΦΟΣ"}}, "σίσυφος", true)) << locale;
    EXPECT_TRUE(matchExactStringWithList({{"ЖУК"}}, "жук", true)) << locale;
    EXPECT_TRUE(matchExactStringWithList({{"TITLE"}}, "title", true)) << locale;
    EXPECT_TRUE(matchStringWithList({{"I"}}, "title", true)) << locale;
    EXPECT_FALSE(matchExactStringWithList({{"TITLE"}}, "tıtle", true)) << locale;
    EXPECT_FALSE(matchStringWithList({{"I"}}, "ı", true)) << locale;
    EXPECT_FALSE(matchExactStringWithList({{"İ"}}, "i", true)) << locale;
    EXPECT_FALSE(matchExactStringWithList({{"A"}}, "Ä", true)) << locale;
  }
  UErrorCode status = U_ZERO_ERROR;
  uloc_setDefault(before.c_str(), &status);
}

// The choice of an entry

TEST(ReportingRulesTest, ChoosesAlphaCommaBetaForBETAButNotForANameWithABlankBehindIt) {
  EXPECT_TRUE(isChosen("Alpha,beta", "BETA"));
  EXPECT_TRUE(isChosen("Alpha,beta", "alpha"));
  EXPECT_FALSE(isChosen("alpha ,beta", "alpha"));
  EXPECT_TRUE(isChosen("alpha ,beta", "Alpha "));
  EXPECT_FALSE(isChosen("Alpha, beta", "beta"));
  EXPECT_FALSE(isChosen("Alpha,beta", "Alpha,beta"));
  EXPECT_FALSE(isChosen("Alphabet", "Alpha"));
}

TEST(ReportingRulesTest, ChoosesAPartOfTheServiceNameButNeverAnEmptyOne) {
  EXPECT_TRUE(serviceIsChosen("call", "VideoCallService"));
  EXPECT_TRUE(serviceIsChosen("fax,,call", "VideoCallService"));
  EXPECT_FALSE(serviceIsChosen("", "VideoCallService"));
  EXPECT_FALSE(serviceIsChosen(",,", "VideoCallService"));
  EXPECT_FALSE(serviceIsChosen(" call", "VideoCallService"));
  EXPECT_FALSE(isChosen("", ""));
  EXPECT_FALSE(isChosen(",Alpha", ""));
}

TEST(ReportingRulesTest, TakesTheFirstEntryThatFitsBoth) {
  const Array clients{entry("Alpha", "fax"), entry("beta", "call"), entry("Alpha", "call"),
                      entry("Alpha", "Video")};
  const auto decision = decideReporting(circumstances(clients, userInfo("Alpha")));
  EXPECT_EQ(decision.entry, *clients[2].dictionary());
  EXPECT_EQ(decision.state, ReportingStateOn);
}

TEST(ReportingRulesTest, ChoosesNoListedNameForUserInfoWithoutNames) {
  Dictionary anyClient = entry("", "call");
  anyClient.remove("client");
  Dictionary anybody = anyClient;
  anybody.remove("service");
  const Dictionary nameless{{"other", 1}};
  EXPECT_EQ(decideReporting(circumstances({entry("Alpha", "call"), anyClient}, nameless)).reason,
            ReportingReason::NoMatchingClient);
  EXPECT_EQ(decideReporting(circumstances({entry("Alpha", "call"), anybody}, nameless)).entry, anybody);
}

TEST(ReportingRulesTest, IsOffWithoutAClientList) {
  ReportingCircumstances given = circumstances(Array(), userInfo("Alpha"));
  given.profile = Dictionary();
  const auto decision = decideReporting(given);
  EXPECT_EQ(decision.state, ReportingStateOff);
  EXPECT_EQ(decision.reason, ReportingReason::NoClientList);
  EXPECT_FALSE(decision.entry);
}

// Lists of an entry

ReportingReason reasonForLocale(const Array& list, const std::optional<std::string>& country) {
  Dictionary only = entry("Alpha", "call");
  only.set("locale_whitelist", list);
  ReportingCircumstances given = circumstances({only}, userInfo("Alpha"));
  given.countryCode = country;
  return decideReporting(given).reason;
}

ReportingReason reasonForDevice(const Array& list, const std::optional<std::string>& family) {
  Dictionary only = entry("Alpha", "call");
  only.set("device_whitelist", list);
  ReportingCircumstances given = circumstances({only}, userInfo("Alpha"));
  given.productFamily = family;
  return decideReporting(given).reason;
}

TEST(ReportingRulesTest, PassesALocaleThatContainsAListedCodeAndADeviceWithoutACountryCode) {
  for (const char* code : {"DE", "de", "D", "e"}) {
    EXPECT_EQ(reasonForLocale({code}, "DE"), ReportingReason::Sampled) << code;
  }
  EXPECT_EQ(reasonForLocale({"FR", "US", "DE"}, "DE"), ReportingReason::Sampled);
  EXPECT_EQ(reasonForLocale({"FR"}, std::nullopt), ReportingReason::Sampled);
}

TEST(ReportingRulesTest, RefusesALocaleThatIsNotListedAndEveryLocaleWithoutAList) {
  for (const char* code : {"DEU", "FR", "", " DE"}) {
    EXPECT_EQ(reasonForLocale({code}, "DE"), ReportingReason::LocaleNotListed) << code;
  }
  EXPECT_EQ(reasonForLocale({"FR"}, ""), ReportingReason::LocaleNotListed);
  EXPECT_EQ(reasonForLocale({}, "DE"), ReportingReason::LocaleNotListed);
  EXPECT_EQ(reasonForLocale({}, std::nullopt), ReportingReason::LocaleNotListed);
}

TEST(ReportingRulesTest, PassesADeviceThatContainsAListedNameAndEveryDeviceWithoutAList) {
  for (const char* name : {"Kasten", "KAST", "ten"}) {
    EXPECT_EQ(reasonForDevice({name}, "Kasten"), ReportingReason::Sampled) << name;
  }
  EXPECT_EQ(reasonForDevice({}, "Kasten"), ReportingReason::Sampled);
  EXPECT_EQ(reasonForDevice({}, std::nullopt), ReportingReason::Sampled);
}

TEST(ReportingRulesTest, RefusesADeviceThatIsNotListed) {
  for (const char* name : {"Kasten2", "Tafel", "", " Kasten"}) {
    EXPECT_EQ(reasonForDevice({name}, "Kasten"), ReportingReason::DeviceNotListed) << name;
  }
  EXPECT_EQ(reasonForDevice({"Kasten"}, std::nullopt), ReportingReason::DeviceNotListed);
}

ReportingDecision decisionWithoutConsent(const Value& override_dnu) {
  Dictionary only = entry("Alpha", "call");
  only.set("override_dnu", override_dnu);
  ReportingCircumstances given = circumstances({only}, userInfo("Alpha"));
  given.consented = false;
  return decideReporting(given);
}

TEST(ReportingRulesTest, ReportsWithoutConsentForAnOverrideThatReadsAsOne) {
  for (const Value& value : Array{1, true, "1", " 1 of", 1.9}) {
    const auto decision = decisionWithoutConsent(value);
    EXPECT_EQ(decision.reason, ReportingReason::Sampled) << value.description();
    EXPECT_EQ(decision.dnuType, DNUTypeOverrideNoConsent) << value.description();
  }
}

TEST(ReportingRulesTest, IsOffWithoutConsentForEveryOtherOverride) {
  for (const Value& value : Array{0, 2, -1, false, 0.9, "yes", "", Value(), Array{1}}) {
    const auto decision = decisionWithoutConsent(value);
    EXPECT_EQ(decision.reason, ReportingReason::NoConsent) << value.description();
    EXPECT_EQ(decision.dnuType, DNUTypeConsent) << value.description();
  }
}

// The trace

TEST(ReportingTraceTest, FollowsTheRulesUpToTheFirstRefusal) {
  using enum ReportingRule;
  Dictionary unfiltered = entry("any", "video");
  unfiltered.remove("filters");
  const auto facts = circumstances({entry("other", "x"), unfiltered}, userInfo("any"));
  ReportingTrace trace;
  EXPECT_EQ(decideReporting(facts, &trace).reason, ReportingReason::NoFilters);
  EXPECT_EQ(trace, (ReportingTrace{{UserInfoNotRequired, false},
                                   {UserInfo, true},
                                   {ClientList, true},
                                   {ClientEntry, false, 0},
                                   {ClientEntry, true, 1},
                                   {Consent, true, 1},
                                   {Locale, true, 1},
                                   {Device, true, 1},
                                   {Filters, false, 1}}));
}

TEST(ReportingTraceTest, EndsWithSamplingWhereNothingElseRefuses) {
  ReportingTrace trace;
  auto facts = circumstances({entry("any", "video")}, userInfo("any"));
  EXPECT_EQ(decideReporting(facts, &trace).state, ReportingStateOn);
  EXPECT_EQ(trace.back(), (ReportingStep{ReportingRule::Sampling, true, 0}));
  facts.samplingFactor = 2;
  trace.clear();
  EXPECT_EQ(decideReporting(facts, &trace).state, ReportingStateOff);
  EXPECT_EQ(trace.back(), (ReportingStep{ReportingRule::Sampling, false, 0}));
}

TEST(ReportingTraceTest, HasOneStepWhereNoUserInfoIsRequired) {
  auto facts = circumstances({}, userInfo("any"));
  facts.requireUserInfo = false;
  ReportingTrace trace;
  EXPECT_EQ(decideReporting(facts, &trace).state, ReportingStateOn);
  EXPECT_EQ(trace, (ReportingTrace{{ReportingRule::UserInfoNotRequired, true}}));
}

}  // namespace
}  // namespace tallyd
