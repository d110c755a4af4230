#include <cmath>

#include "HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

using platform::Data;
using platform::Date;
using platform::Value;

/// Storebags are signed, but whoever signs them makes mistakes too.
class MalformedStorebagTest : public HTTPSPostBackendFixture {
 protected:
  /// One value of each kind.
  static std::vector<Value> oneOfEachKind() {
    return {Value(),
            true,
            5,
            -1.5,
            "text",
            Date{1000},
            Data("\x01"),
            Array{"Alpha", Array{1}, Value()},
            Array(),
            Dictionary(),
            Dictionary{{"key", "k"}},
            std::nan(""),
            "",
            std::numeric_limits<std::int64_t>::min(),
            std::numeric_limits<std::uint64_t>::max(),
            1e300};
  }
  static bool isListOrDictionary(const Value& value) { return value.array() || value.dictionary(); }
};

TEST_F(MalformedStorebagTest, PassesOverClientEntriesThatAreNoDictionariesWithoutHarmToTheNext) {
  Array clients;
  for (const Value& value : oneOfEachKind()) {
    if (!value.dictionary()) clients.append(value);
  }
  clients.append(defaultEntry());
  const auto backend = evaluated(clients);
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(backend->postURL(), kURL);
}

TEST_F(MalformedStorebagTest, SurvivesAValueOfEveryKindUnderEveryKey) {
  for (const char* key :
       {"client", "service", "hierarchy", "override_dnu", "locale_whitelist", "device_whitelist", "filters",
        "sampling_threshold", "event_threshold", "extras_on_internal", "post_url"}) {
    for (const Value& value : oneOfEachKind()) {
      const auto backend = evaluated({entryWith(key, value)});
      EXPECT_GE(backend->state(), ReportingStatePending);
      EXPECT_LE(backend->state(), ReportingStateOn);
      backend->setState(ReportingStateOn);
      backend->setIsInternal(true);
      const std::size_t before = postCount();
      backend->sendMessage(Dictionary{{"k", "v"}}, kEventTime, 3, 1);
      ASSERT_EQ(postCount(), before + 1) << key << " " << value.description();
      EXPECT_EQ(lastEvents().size(), 1U) << key << " " << value.description();
    }
  }
}

TEST_F(MalformedStorebagTest, ReadsTextThatIsNoneAsAbsent) {
  for (const Value& value : oneOfEachKind()) {
    if (value.isString()) continue;
    EXPECT_EQ(evaluated({entryWith("client", value)}, userInfo("anybody"))->state(), ReportingStateOn)
        << value.description();
    EXPECT_EQ(evaluated({entryWith("service", value)})->state(), ReportingStateOn) << value.description();
    EXPECT_EQ(evaluated({entryWith("post_url", value)})->postURL(), std::nullopt) << value.description();
  }
}

TEST_F(MalformedStorebagTest, ReadsListsThatAreNoneAsAbsent) {
  for (const Value& value : oneOfEachKind()) {
    if (value.array()) continue;
    fake.log.clear();
    EXPECT_EQ(evaluated({entryWith("locale_whitelist", value)})->state(), ReportingStateOff);
    EXPECT_EQ(lines(),
              (Lines{{Level::Debug, "Tally(updateBackendState): (DE) isn't in locale list (null)"}}));
    fake.log.clear();
    EXPECT_EQ(evaluated({entryWith("filters", value)})->state(), ReportingStateOff);
    EXPECT_EQ(lines(), (Lines{{Level::Warning, "Tally(updateBackendState): filters are required."}}));
    EXPECT_EQ(evaluated({entryWith("device_whitelist", value)})->state(), ReportingStateOn);
  }
}

TEST_F(MalformedStorebagTest, PassesOverListElementsThatAreNoText) {
  EXPECT_EQ(evaluated({entryWith("locale_whitelist", Array{5, Value(), Array{"DE"}, "DE"})})->state(),
            ReportingStateOn);
  EXPECT_EQ(evaluated({entryWith("locale_whitelist", Array{5, Array{"DE"}})})->state(), ReportingStateOff);
  EXPECT_EQ(evaluated({entryWith("device_whitelist", Array{5, "Tafel"})})->state(), ReportingStateOff);
  EXPECT_EQ(evaluated({entryWith("device_whitelist", Array{Value(5)})})->state(), ReportingStateOff);
}

TEST_F(MalformedStorebagTest, ReadsNumbersThatAreText) {
  Dictionary entry = defaultEntry();
  entry.set("hierarchy", "12");
  entry.set("override_dnu", "1");
  entry.set("sampling_threshold", "0.5");
  entry.set("event_threshold", " 7 events");
  entry.set("extras_on_internal", "1");
  const auto backend = evaluated({entry});
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(backend->hierarchy(), 12);
  EXPECT_EQ(backend->dnuType(), DNUTypeOverrideConsent);
  EXPECT_EQ(backend->eventThreshold(), 7);
  EXPECT_TRUE(fake.log.has(Level::Debug, "HTTPSPostBackend(updateBackendState): event_threshold set to 7"));
  EXPECT_TRUE(
      fake.log.has(Level::Debug, "HTTPSPostBackend(updateBackendState): extras on internal is set to 1"));
}

TEST_F(MalformedStorebagTest, ReadsNumbersThatAreNoneAsAbsent) {
  for (const Value& value :
       {Value(), Value(Array{1}), Value(Dictionary()), Value(Data("1")), Value(Date{1})}) {
    Dictionary entry = defaultEntry();
    for (const char* key : {"hierarchy", "override_dnu", "event_threshold", "extras_on_internal"}) {
      entry.set(key, value);
    }
    const auto backend = evaluated({entry});
    EXPECT_EQ(backend->state(), ReportingStateOn) << value.description();
    EXPECT_EQ(backend->hierarchy(), 0);
    EXPECT_EQ(backend->dnuType(), DNUTypeConsent);
    EXPECT_EQ(backend->eventThreshold(), 49);
    EXPECT_EQ(evaluated({entryWith("sampling_threshold", value)})->state(), ReportingStateOff);
  }
  EXPECT_FALSE(
      fake.log.hasTextStartingWith(Level::Debug, "HTTPSPostBackend(updateBackendState): extras on internal"));
}

TEST_F(MalformedStorebagTest, IsOffForASamplingThresholdThatIsNoNumberAndStillPostsAStopMessage) {
  const auto backend = evaluated({entryWith("sampling_threshold", std::nan(""))});
  EXPECT_EQ(backend->state(), ReportingStateOff);
  backend->setState(ReportingStateOn);
  backend->sendMessage(Dictionary(), kEventTime, 0, 1);
  EXPECT_FALSE(lastEvent().contains("SamplingThreshold"));
  EXPECT_TRUE(fake.log.has(Level::Warning,
                           "Tally: NSJSONSerialization unable to handle key: SamplingThreshold, value: nan"));
}

TEST_F(MalformedStorebagTest, PassesOverUserInfoNamesThatAreNoText) {
  const Dictionary info{{kTallyUserInfoClientName.data(), Array{"Alpha"}},
                        {kTallyUserInfoServiceName.data(), 5}};
  EXPECT_EQ(evaluated({defaultEntry()}, info)->state(), ReportingStatePending);
  EXPECT_EQ(evaluated({entryWithout("client")}, info)->state(), ReportingStateOn);
}

TEST_F(MalformedStorebagTest, FindsTheLastOfAThousandClientEntries) {
  std::vector<Value> clients;
  for (int i = 0; i < 999; ++i) clients.emplace_back(entryWith("client", "Client" + std::to_string(i)));
  clients.emplace_back(entryWith("post_url", "https://last.example/"));
  const auto backend = evaluated(Array(std::move(clients)));
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_EQ(backend->postURL(), "https://last.example/");
}

TEST_F(MalformedStorebagTest, FindsANameAmongTenThousandOfOneEntry) {
  std::string names;
  for (int i = 0; i < 10'000; ++i) names += "Client" + std::to_string(i) + ",";
  EXPECT_EQ(evaluated({entryWith("client", names + "Alpha")})->state(), ReportingStateOn);
  EXPECT_EQ(evaluated({entryWith("client", names)})->state(), ReportingStatePending);
}

TEST_F(MalformedStorebagTest, AppliesTenThousandFilterRules) {
  std::vector<Value> rules;
  for (int i = 0; i < 10'000; ++i) {
    rules.emplace_back(Dictionary{{"key", "field" + std::to_string(i)}, {"action", "remove"}});
  }
  const auto backend = evaluated({entryWith("filters", Array(std::move(rules)))});
  backend->sendMessage(Dictionary{{"field0", 1}, {"field9999", 1}, {"field10000", 1}}, kEventTime, 3, 4);
  EXPECT_FALSE(lastEvent().contains("field0"));
  EXPECT_FALSE(lastEvent().contains("field9999"));
  EXPECT_TRUE(lastEvent().contains("field10000"));
}

}  // namespace
}  // namespace tallyd
