#include "platform/log/JournalLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <vector>

namespace tallyd::platform {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::UnorderedElementsAre;
using Entry = std::vector<std::string>;

std::vector<Entry> journal;  // A plain function takes the entries, as in the real journal's interface.

int takeEntry(const iovec* fields, int count) {
  Entry entry;
  for (int i = 0; i < count; ++i)
    entry.emplace_back(static_cast<const char*>(fields[i].iov_base), fields[i].iov_len);
  journal.push_back(entry);
  return 0;
}

int refuse(const iovec*, int) { return -ENOBUFS; }

class JournalLogTest : public testing::Test {
 protected:
  void SetUp() override { journal.clear(); }
  JournalLog _log{LogLevel::Debug, &takeEntry};
};

TEST_F(JournalLogTest, SendsOneEntryWithAllFields) {
  _log.open("tallyd", "Daemon");
  asl_log(_log, LogLevel::Info, "{} sessions", 3);
  EXPECT_THAT(journal, ElementsAre(UnorderedElementsAre("MESSAGE=3 sessions", "PRIORITY=6",
                                                        "SYSLOG_IDENTIFIER=tallyd", "SYSLOG_FACILITY=3")));
}

TEST_F(JournalLogTest, DropsTheFinalLineFeedAndKeepsInnerOnes) {
  _log.open("tallyd", "Daemon");
  _log.write(LogLevel::Error, "one\ntwo\n");
  EXPECT_THAT(journal, ElementsAre(Contains("MESSAGE=one\ntwo")));
}

TEST_F(JournalLogTest, SendsLongMessagesWhole) {
  const std::string message(1'000'000, 'x');
  _log.open("tallyd", "Daemon");
  _log.write(LogLevel::Debug, message);
  EXPECT_THAT(journal, ElementsAre(Contains("MESSAGE=" + message)));
}

TEST_F(JournalLogTest, SendsNoEmptyFieldsBeforeItIsOpen) {
  _log.write(LogLevel::Critical, "early");
  EXPECT_THAT(journal, ElementsAre(ElementsAre("MESSAGE=early", "PRIORITY=2")));
}

TEST_F(JournalLogTest, ARefusingJournalDisturbsNobody) {
  JournalLog log(LogLevel::Debug, &refuse);
  log.open("tallyd", "Daemon");
  log.write(LogLevel::Info, "lost");
  log.close();
}

TEST_F(JournalLogTest, TheRealJournalsAbsenceDisturbsNobody) {
  JournalLog log(LogLevel::Debug);
  log.open("tallyd-test", "Daemon");
  log.write(LogLevel::Debug, "a line of the unit tests");
  log.close();
}

}  // namespace
}  // namespace tallyd::platform
