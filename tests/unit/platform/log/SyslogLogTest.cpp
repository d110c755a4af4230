#include "platform/log/SyslogLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <syslog.h>

#include <utility>
#include <vector>

#include "platform/log/SyslogFacility.h"

namespace tallyd::platform {
namespace {

using testing::ElementsAre;
using testing::Pair;

std::vector<std::pair<int, std::string>> lines;

void takeLine(int priority, std::string_view message) { lines.emplace_back(priority, message); }

TEST(SyslogLogTest, HandsOverPriorityAndMessage) {
  lines.clear();
  SyslogLog log(LogLevel::Info, &takeLine);
  log.open("tallyd", "Daemon");
  asl_log(log, LogLevel::Error, "100% of {}\n", "it");
  asl_log(log, LogLevel::Debug, "left out");
  log.close();
  EXPECT_THAT(lines, ElementsAre(Pair(LOG_ERR, "100% of it")));
}

TEST(SyslogLogTest, TheRealSyslogsAbsenceDisturbsNobody) {
  SyslogLog log(LogLevel::Debug);
  log.open("tallyd-test", "Daemon");
  log.write(LogLevel::Debug, "a line of the unit tests with a %s in it");
  log.close();
  log.write(LogLevel::Debug, "and one after the end");
}

TEST(SyslogFacilityTest, FindsFacilitiesByNameInAnyCase) {
  EXPECT_EQ(syslogFacility("Daemon"), LOG_DAEMON);
  EXPECT_EQ(syslogFacility("local3"), LOG_LOCAL3);
  EXPECT_EQ(syslogFacility("MAIL"), LOG_MAIL);
  EXPECT_EQ(facilityNumber(syslogFacility("Daemon")), 3);
}

TEST(SyslogFacilityTest, TakesAnUnknownFacilityForTheUsers) {
  EXPECT_EQ(syslogFacility("Kitchen"), LOG_USER);
  EXPECT_EQ(syslogFacility(""), LOG_USER);
}

}  // namespace
}  // namespace tallyd::platform
