#include "station/PageRecord.h"

#include <gtest/gtest.h>

#include "platform/JSON.h"

namespace tallyd::station {

using platform::Dictionary;

namespace {

PageRecord recordOf(Feed::Kind kind, const std::string& json) {
  return pageRecordOf({7, kind, std::make_shared<const std::string>(json)});
}

Dictionary shownBy(const PageRecord& record) {
  const auto parsed = platform::valueFromJSON(record.json);
  return parsed.value && parsed.value->dictionary() ? *parsed.value->dictionary() : Dictionary();
}

}  // namespace

TEST(PageRecordTest, ReadsAnEvent) {
  const PageRecord record = recordOf(
      Feed::Kind::Event,
      R"({"clientId":"C","encoding":"gzip","postTime":"9","event":{"_sessionID":"G.P.K","_sender":"PH","_method":"4",)"
      R"("_status":"2","_eventNumber":"17","_startTS":"60","_productFamily":"Desk","eventTime":"61.250",)"
      R"("ClientName":"Studio","ServiceName":"Calls","speed":2.5,"on":true,"note":"hi","list":[1,2]}})");
  EXPECT_EQ(record.session, "K");
  EXPECT_EQ(record.parent, "P");
  EXPECT_EQ(record.sender, "PH");
  EXPECT_EQ(record.client, "Studio, Calls");
  EXPECT_EQ(record.device, "Desk");
  EXPECT_EQ(record.started, "60");
  EXPECT_EQ(record.eventNumber, 17);
  const Dictionary shown = shownBy(record);
  EXPECT_EQ(shown.integer("n"), 7);
  EXPECT_EQ(shown.string("kind"), "event");
  EXPECT_EQ(shown.real("time"), 61.25);
  EXPECT_EQ(shown.string("method"), "4");
  const Dictionary expected{{"speed", 2.5}, {"on", true}, {"note", "hi"}, {"list", "[1,2]"}};
  ASSERT_NE(shown.dictionary("fields"), nullptr);
  EXPECT_EQ(*shown.dictionary("fields"), expected);
  ASSERT_NE(shown.dictionary("facts"), nullptr);
  EXPECT_EQ(shown.dictionary("facts")->string("clientId"), "C");
  EXPECT_EQ(shown.dictionary("facts")->string("_sessionID"), "G.P.K");
}

TEST(PageRecordTest, NamesNoParentOfASessionWithoutOne) {
  const PageRecord record = recordOf(Feed::Kind::Event, R"({"event":{"_sessionID":"K"},"clientId":"C"})");
  EXPECT_EQ(record.session, "K");
  EXPECT_EQ(record.parent, "");
  EXPECT_EQ(record.device, "C");
}

TEST(PageRecordTest, ReadsADatagram) {
  const PageRecord record =
      recordOf(Feed::Kind::Datagram,
               R"({"session":1201,"sender":"VT","device":"ab","eventNumber":3,"method":1,"status":0,)"
               R"("sentTime":5.5,"fields":{"rtt":"40"},"retransmission":true,"duplicate":true})");
  EXPECT_EQ(record.session, "1201");
  EXPECT_EQ(record.device, "ab");
  EXPECT_EQ(record.eventNumber, 3);
  EXPECT_TRUE(record.isRetried);
  EXPECT_FALSE(record.isLost);
  const Dictionary shown = shownBy(record);
  EXPECT_EQ(shown.real("time"), 5.5);
  EXPECT_TRUE(shown.boolean("repeated"));
  EXPECT_FALSE(shown.contains("lost"));
  EXPECT_TRUE(recordOf(Feed::Kind::Datagram, R"({"session":1,"lost":true})").isLost);
}

TEST(PageRecordTest, LinksAnUploadedFile) {
  const PageRecord record =
      recordOf(Feed::Kind::Upload,
               R"({"sequence":"5","uuid":"ab","bytes":12,"time":9,"file":"uploads/20260301T1-a.log"})");
  EXPECT_EQ(record.session, "5");
  EXPECT_EQ(record.bytes, 12U);
  EXPECT_EQ(shownBy(record).string("name"), "a.log");
  EXPECT_EQ(shownBy(record).string("link"), "/uploads/20260301T1-a.log");
}

TEST(PageRecordTest, NamesTheLocationOfLogData) {
  const PageRecord record =
      recordOf(Feed::Kind::LogData, R"({"time":9,"bytes":4,"location":"logdata.jsonl:1","logData":["a"]})");
  EXPECT_EQ(shownBy(record).string("name"), "logdata.jsonl:1");
  EXPECT_FALSE(shownBy(record).contains("link"));
}

TEST(PageRecordTest, CutsWhatIsTooLong) {
  std::string fields;
  for (std::size_t i = 0; i < kShownFields + 5; ++i) fields += ",\"k" + std::to_string(1000 + i) + "\":1";
  const std::string text(kShownFieldBytes * 3, 'x');
  const PageRecord record =
      recordOf(Feed::Kind::Event, R"({"event":{"_sessionID":"K","a":")" + text + "\"" + fields + "}}");
  const Dictionary shown = shownBy(record);
  EXPECT_EQ(shown.integer("omitted"), 6);
  ASSERT_NE(shown.dictionary("fields"), nullptr);
  EXPECT_EQ(shown.dictionary("fields")->size(), kShownFields);
  EXPECT_LT(shown.dictionary("fields")->string("a").value_or("").size(), kShownFieldBytes + 10);
}

TEST(PageRecordTest, MakesSomethingOfAnyRecord) {
  for (const char* json : {"", "[]", "{}", R"({"event":5})", R"({"event":{"_sessionID":["a"]}})"}) {
    for (const auto kind : {Feed::Kind::Event, Feed::Kind::Datagram, Feed::Kind::Upload, Feed::Kind::LogData})
      EXPECT_EQ(shownBy(recordOf(kind, json)).integer("n"), 7) << json;
  }
}

}  // namespace tallyd::station
