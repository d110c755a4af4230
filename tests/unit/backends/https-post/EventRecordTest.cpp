#include "backends/https-post/EventRecord.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "backends/https-post/PostBody.h"

namespace tallyd {
namespace {

using platform::Dictionary;
using platform::Value;

EventFacts facts() {
  return {.sessionStart = 1'768'478'459.5,
          .sender = "DH",
          .clientVersion = 12,
          .sessionID = "77",
          .eventNumber = 5,
          .method = 3,
          .status = 4,
          .eventTime = 1'768'478'460.75,
          .productFamily = "Kasten",
          .productModel = "Kasten3,1",
          .osVersion = "12.4",
          .build = "12D500",
          .isInternal = false,
          .reportVersionMajor = 7,
          .reportVersionMinor = 42,
          .timezoneOffset = std::chrono::seconds(3600)};
}

Dictionary fieldsOf(const EventRecord& record) {
  EventFields fields;
  record.fieldsInto(fields);
  return fields.dictionary();
}

struct ShiftedTimes {
  std::string start;
  std::string event;
};

ShiftedTimes timesOf(double sessionStart, double eventTime) {
  EventFacts given = facts();
  given.sessionStart = sessionStart;
  given.eventTime = eventTime;
  const Dictionary record = fieldsOf(EventRecords().record(std::nullopt, given));
  EXPECT_EQ(record.string("eventTime"), record.string("_clientTS"));
  return {std::string(record.string("_startTS").value_or("")),
          std::string(record.string("_clientTS").value_or(""))};
}

TEST(EventRecordTest, HoldsEveryFactUnderItsKeyAsTextAndTheTimeZoneAsNumber) {
  EXPECT_EQ(fieldsOf(EventRecords().record(std::nullopt, facts())),
            (Dictionary{{"_startTS", "1768478400"},
                        {"_sender", "DH"},
                        {"_clientVersion", "12"},
                        {"_sessionID", "77"},
                        {"_eventNumber", "5"},
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
                        {"_timezoneOffset", 3600}}));
}

TEST(EventRecordTest, PutsASessionStartedAt12_00_59_500AtTheWholeMinuteAndItsEventsAsFarBehindItAsTheyWere) {
  const auto [start, event] = timesOf(1'768'478'459.5, 1'768'478'460.75);
  EXPECT_EQ(start, "1768478400");
  EXPECT_EQ(event, "1768478401.250");
}

TEST(EventRecordTest, KeepsTheDifferenceOfTwoEventsExact) {
  EXPECT_EQ(timesOf(1'768'478'459.999, 1'768'478'460.0).event, "1768478400.001");
  EXPECT_EQ(timesOf(1'768'478'459.999, 1'768'478'465.0).event, "1768478405.001");
}

TEST(EventRecordTest, PutsAnEventFromBeforeTheStartBeforeTheMinute) {
  const auto [start, event] = timesOf(1'768'478'400, 1'768'478'397.5);
  EXPECT_EQ(start, "1768478400");
  EXPECT_EQ(event, "1768478397.500");
}

TEST(EventRecordTest, CutsNegativeTimesTowardZero) {
  EXPECT_EQ(timesOf(-59.9, -59.9).start, "0");
  EXPECT_EQ(timesOf(-59.9, -58.4).event, "1.500");
  EXPECT_EQ(timesOf(-60, -60).start, "-60");
  EXPECT_EQ(timesOf(-90.5, -89.5).start, "-60");
  EXPECT_EQ(timesOf(-90.5, -89.5).event, "-59.000");
  EXPECT_EQ(timesOf(0, 0).start, "0");
  EXPECT_EQ(timesOf(0, 0).event, "0.000");
}

TEST(EventRecordTest, KeepsLargeTimesWhole) {
  EXPECT_EQ(timesOf(4'294'967'399.25, 4'294'967'400.5).start, "4294967340");
  EXPECT_EQ(timesOf(4'294'967'399.25, 4'294'967'400.5).event, "4294967341.250");
  EXPECT_EQ(timesOf(253'402'300'799.5, 253'402'300'800.75).start, "253402300740");
  EXPECT_EQ(timesOf(253'402'300'799.5, 253'402'300'800.75).event, "253402300741.250");
  EXPECT_EQ(timesOf(1e15, 1e15 + 1).start, "999999999999960");
  EXPECT_EQ(timesOf(1e15, 1e15 + 1).event, "999999999999961.000");
}

TEST(EventRecordTest, RoundsTheEventTimeToMilliseconds) {
  EXPECT_EQ(timesOf(0, 0.0004).event, "0.000");
  EXPECT_EQ(timesOf(0, 0.0006).event, "0.001");
  EXPECT_EQ(timesOf(0, 0.9996).event, "1.000");
}

TEST(EventRecordTest, RoundsHalvesToEvenAndCarriesLikeEveryFormatter) {
  EXPECT_EQ(timesOf(0, 60'000.0625).event, "60000.062");
  EXPECT_EQ(timesOf(0, 60'000.1875).event, "60000.188");
  EXPECT_EQ(timesOf(0, 1'768'478'400.99975).event, "1768478401.000");
  std::mt19937_64 random(7);
  std::uniform_real_distribution<double> exponent(0, 13);
  for (int i = 0; i < 20'000; ++i) {
    const double time = std::pow(10, exponent(random));
    EXPECT_EQ(timesOf(0, time).event, fmt::format("{:.3f}", time));
  }
}

TEST(EventRecordTest, TruncatesToTheMinuteTowardZero) {
  for (const auto& [seconds, minute] : std::initializer_list<std::pair<std::int64_t, std::int64_t>>{
           {0, 0}, {59, 0}, {60, 60}, {61, 60}, {119, 60}, {-1, 0}, {-59, 0}, {-60, -60}, {-61, -60}}) {
    EXPECT_EQ(truncateToMinute(seconds), minute) << seconds;
  }
}

TEST(EventRecordTest, KeepsPayloadFieldsAndOverwritesThoseOfItsOwnNames) {
  const Dictionary payload{{"bitrate", 500},
                           {"_method", "forged"},
                           {"eventTime", 1},
                           {"_sender", "other"},
                           {"list", platform::Array{1}}};
  const Dictionary record = fieldsOf(EventRecords().record(payload, facts()));
  EXPECT_EQ(record.integer("bitrate"), 500);
  EXPECT_EQ(*record.find("list"), Value(platform::Array{1}));
  EXPECT_EQ(record.string("_method"), "3");
  EXPECT_EQ(record.string("eventTime"), "1768478401.250");
  EXPECT_EQ(record.string("_sender"), "DH");
  EXPECT_EQ(record.size(), 18U);
}

TEST(EventRecordTest, LeavesMissingDeviceFactsOutAlsoWhereThePayloadHasThem) {
  EventFacts given = facts();
  given.productFamily = given.productModel = given.osVersion = given.build = std::nullopt;
  const Dictionary payload{
      {"_productFamily", "a"}, {"_productModel", "b"}, {"_osVersion", "c"}, {"_build", "d"}};
  const Dictionary record = fieldsOf(EventRecords().record(payload, given));
  for (const char* key : {"_productFamily", "_productModel", "_osVersion", "_build"}) {
    EXPECT_FALSE(record.contains(key)) << key;
  }
  EXPECT_EQ(record.size(), 12U);
}

TEST(EventRecordTest, WritesTheLargestNumbersWhole) {
  EventFacts given = facts();
  given.clientVersion = given.eventNumber = given.method = given.status = 65'535;
  given.reportVersionMajor = given.reportVersionMinor = 255;
  given.isInternal = true;
  const Dictionary record = fieldsOf(EventRecords().record(std::nullopt, given));
  for (const char* key : {"_clientVersion", "_eventNumber", "_method", "_status"}) {
    EXPECT_EQ(record.string(key), "65535") << key;
  }
  EXPECT_EQ(record.string("_reportVers"), "255.255");
  EXPECT_EQ(record.string("_internal"), "1");
}

TEST(EventRecordTest, GivesTheTimeZoneAsANumberThatMayBeNegative) {
  EventFacts given = facts();
  given.timezoneOffset = std::chrono::seconds(-34'200);
  const Dictionary record = fieldsOf(EventRecords().record(std::nullopt, given));
  ASSERT_TRUE(record.contains("_timezoneOffset"));
  EXPECT_TRUE(record.find("_timezoneOffset")->isInteger());
  EXPECT_EQ(record.integer("_timezoneOffset"), -34'200);
}

TEST(EventRecordTest, FollowsFactsThatChangeFromEventToEvent) {
  EventRecords records;
  EventFacts given = facts();
  const auto sameAsAlone = [&](const std::optional<Dictionary>& payload) {
    return fieldsOf(records.record(payload, given)) == fieldsOf(EventRecords().record(payload, given));
  };
  EXPECT_TRUE(sameAsAlone(std::nullopt));
  given.sessionID = "P.77";
  EXPECT_TRUE(sameAsAlone(Dictionary{{"a", 1}}));
  given.build = std::nullopt;
  EXPECT_TRUE(sameAsAlone(Dictionary{{"_build", "of the payload"}}));
  given.build = "12D501";
  given.eventNumber = 6;
  EXPECT_TRUE(sameAsAlone(Dictionary{{"_build", "of the payload"}}));
  given.sessionStart += 60;
  given.isInternal = true;
  given.reportVersionMinor = 43;
  EXPECT_TRUE(sameAsAlone(std::nullopt));
}

TEST(EventRecordTest, LeavesARecordAsItIsWhenLaterFactsDiffer) {
  EventRecords records;
  EventFacts given = facts();
  const EventRecord first = records.record(Dictionary{{"a", 1}}, given);
  const Dictionary before = fieldsOf(first);
  given.sessionID = "other";
  given.build = std::nullopt;
  given.sessionStart += 600;
  (void)records.record(std::nullopt, given);
  EXPECT_EQ(fieldsOf(first), before);
}

TEST(EventRecordTest, TakesAnotherSessionIDLater) {
  EventRecords records;
  EventRecord renamed = records.record(std::nullopt, facts());
  const EventRecord other = records.record(std::nullopt, facts());
  renamed.setSessionID("parent.77");
  EXPECT_EQ(fieldsOf(renamed).string("_sessionID"), "parent.77");
  EXPECT_EQ(fieldsOf(other).string("_sessionID"), "77");
}

TEST(EventRecordTest, WritesEveryFieldAsItsValueWouldBeWritten) {
  EventFacts given = facts();
  given.productFamily = "Kas\"ten";
  given.osVersion = "12\xFF";
  EventFields fields;
  const EventRecord record = EventRecords().record(Dictionary{{"zeta", 1}, {"Alpha", "x"}}, given);
  record.fieldsInto(fields);
  platform::JSONText json;
  appendEvent(json, fields);
  EXPECT_EQ(json.view(), platform::jsonFromValue(fields.dictionary()));
}

TEST(EventRecordTest, KeepsTextsOfItsOwnForTheNextComparison) {
  EventRecords records;
  EventFacts given = facts();
  std::string session = "first";
  given.sessionID = session;
  EXPECT_EQ(fieldsOf(records.record(std::nullopt, given)).string("_sessionID"), "first");
  session = "other";  // In the same place, and of the same length.
  given.sessionID = session;
  EXPECT_EQ(fieldsOf(records.record(std::nullopt, given)).string("_sessionID"), "other");
}

}  // namespace
}  // namespace tallyd
