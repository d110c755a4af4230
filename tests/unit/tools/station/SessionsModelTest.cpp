#include "station/SessionsModel.h"

#include <gtest/gtest.h>

#include "platform/JSON.h"

namespace tallyd::station {

using platform::Dictionary;

namespace {

PageRecord event(const std::string& session, int number, const std::string& started = "60") {
  PageRecord record;
  record.session = session;
  record.started = started;
  record.sender = "PH";
  record.eventNumber = static_cast<std::uint16_t>(number);
  return record;
}

PageRecord datagram(const std::string& session, int number) {
  PageRecord record = event(session, number);
  record.kind = Feed::Kind::Datagram;
  return record;
}

Dictionary only(const std::vector<std::string>& changed) {
  EXPECT_EQ(changed.size(), 1U);
  const auto parsed = platform::valueFromJSON(changed.empty() ? "" : changed.front());
  return parsed.value && parsed.value->dictionary() ? *parsed.value->dictionary() : Dictionary();
}

std::int64_t count(const Dictionary& session, const char* delivery, const char* key) {
  const Dictionary* found = session.dictionary(delivery);
  return found == nullptr ? -1 : found->integer(key).value_or(-1);
}

}  // namespace

TEST(SessionsModelTest, SumsUpASession) {
  SessionsModel model;
  model.take(event("K", 1), 100);
  PageRecord named = event("K", 3);
  named.parent = "P";
  named.client = "Studio";
  named.device = "Desk";
  model.take(named, 105.5);
  PageRecord file = event("K", 0);
  file.kind = Feed::Kind::Upload;
  file.bytes = 12;
  model.take(file, 106);

  const Dictionary session = only(model.changedSince(0));
  EXPECT_EQ(session.string("session"), "K");
  EXPECT_EQ(session.string("parent"), "P");
  EXPECT_EQ(session.real("first"), 100);
  EXPECT_EQ(session.real("last"), 106);
  EXPECT_EQ(count(session, "events", "received"), 2);
  EXPECT_EQ(count(session, "events", "missing"), 1);
  EXPECT_EQ(session.dictionary("events")->string("gaps"), "2");
  EXPECT_EQ(count(session, "datagrams", "received"), 0);
  EXPECT_EQ(session.integer("uploads"), 1);
  EXPECT_EQ(session.integer("uploadBytes"), 12);
}

TEST(SessionsModelTest, CountsWhatWasLostOnPurposeApart) {
  SessionsModel model;
  PageRecord lost = datagram("5", 1);
  lost.isLost = true;
  model.take(lost, 1);
  PageRecord retried = datagram("5", 1);
  retried.isRetried = true;
  model.take(retried, 2);
  model.take(datagram("5", 2), 3);
  model.take(datagram("5", 2), 4);

  const Dictionary session = only(model.changedSince(0));
  EXPECT_EQ(count(session, "datagrams", "received"), 4);
  EXPECT_EQ(count(session, "datagrams", "distinct"), 2);
  EXPECT_EQ(count(session, "datagrams", "repeated"), 1);
  EXPECT_EQ(count(session, "datagrams", "lost"), 1);
  EXPECT_EQ(count(session, "datagrams", "retried"), 1);
  EXPECT_EQ(count(session, "datagrams", "missing"), 0);
}

TEST(SessionsModelTest, TellsAStartedAgainSessionFromRepeatedEvents) {
  SessionsModel model;
  for (const char* started : {"60", "120"})
    for (const int number : {1, 2}) model.take(event("K", number, started), 1);
  const Dictionary session = only(model.changedSince(0));
  EXPECT_EQ(count(session, "events", "distinct"), 4);
  EXPECT_EQ(count(session, "events", "repeated"), 0);
}

TEST(SessionsModelTest, TellsOnlyWhatChanged) {
  SessionsModel model;
  model.take(event("A", 1), 1);
  const auto before = model.revision();
  EXPECT_TRUE(model.changedSince(before).empty());
  model.take(event("B", 1), 2);
  EXPECT_EQ(only(model.changedSince(before)).string("session"), "B");
}

TEST(SessionsModelTest, PassesOverRecordsWithoutASession) {
  SessionsModel model;
  model.take(event("", 1), 1);
  EXPECT_TRUE(model.changedSince(0).empty());
}

TEST(SessionsModelTest, ForgetsTheSessionThatWasSilentForLongest) {
  SessionsModel model;
  for (std::size_t i = 0; i < SessionsModel::kMaximumSessions; ++i) {
    model.take(event("s" + std::to_string(i), 1), 1);
  }
  model.take(event("s0", 2), 2);
  const auto before = model.revision();
  model.take(event("new", 1), 3);
  EXPECT_EQ(model.changedSince(0).size(), SessionsModel::kMaximumSessions);
  model.take(event("s0", 3), 4);
  const auto changed = model.changedSince(before);
  ASSERT_EQ(changed.size(), 2U);  // The new one, and the oldest, which is still itself.
  for (const std::string& json : changed) {
    const Dictionary session = only({json});
    EXPECT_EQ(count(session, "events", "received"), session.string("session") == "s0" ? 3 : 1);
  }
}

TEST(SessionsModelTest, NamesAFewSendersAtMost) {
  SessionsModel model;
  for (int i = 0; i < 10; ++i) {
    PageRecord record = event("K", i + 1);
    record.device = "d" + std::to_string(i);
    model.take(record, 1);
  }
  EXPECT_EQ(only(model.changedSince(0)).array("devices")->size(), SessionsModel::kMaximumNames);
}

}  // namespace tallyd::station
