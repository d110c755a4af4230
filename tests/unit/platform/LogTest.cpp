#include "platform/Log.h"

#include <gtest/gtest.h>

#include <new>

#include "fakes/FakeLog.h"
#include "fakes/TooLarge.h"

namespace tallyd::platform {
namespace {

TEST(LogTest, WritesOneFormattedLine) {
  fakes::FakeLog log;
  asl_log(log, LogLevel::Warning, "{} of {}", 1, "two");
  EXPECT_EQ(log.lines(), (std::vector<fakes::FakeLog::Line>{{LogLevel::Warning, "1 of two"}}));
}

TEST(LogTest, FormatsNothingThatNobodyTakes) {
  fakes::FakeLog log(LogLevel::Info);
  asl_log(log, LogLevel::Debug, "{}", fakes::TooLarge());
  EXPECT_TRUE(log.lines().empty());
}

TEST(LogTest, LosesALineForWhichThereIsNoMemoryAndFailsNobody) {
  class FullLog : public fakes::FakeLog {
   public:
    void write(LogLevel, std::string_view) override { throw std::bad_alloc(); }
  } full;
  EXPECT_NO_THROW(asl_log(full, LogLevel::Critical, "a line"));
  fakes::FakeLog log;
  EXPECT_NO_THROW(asl_log(log, LogLevel::Critical, "{}", fakes::TooLarge()));
  EXPECT_TRUE(log.lines().empty());
}

}  // namespace
}  // namespace tallyd::platform
