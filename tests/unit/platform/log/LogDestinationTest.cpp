#include "platform/log/LogDestination.h"

#include <gtest/gtest.h>

#include <set>
#include <string>

#include "platform/log/JournalLog.h"
#include "platform/log/StderrLog.h"
#include "platform/log/SyslogLog.h"

namespace tallyd::platform {
namespace {

class NoClock final : public Clock {
 public:
  [[nodiscard]] TimePoint now() const override { return {}; }
};

LogDestination defaultWith(const std::set<std::string>& paths) {
  return defaultLogDestination(
      [&](const std::filesystem::path& path) { return paths.contains(path.string()); });
}

TEST(LogDestinationTest, PrefersTheJournalThenSyslogThenStandardError) {
  EXPECT_EQ(defaultWith({"/run/systemd/journal/socket", "/dev/log"}), LogDestination::Journal);
  EXPECT_EQ(defaultWith({"/run/systemd/journal/socket"}), LogDestination::Journal);
  EXPECT_EQ(defaultWith({"/dev/log"}), LogDestination::Syslog);
  EXPECT_EQ(defaultWith({}), LogDestination::StandardError);
}

TEST(LogDestinationTest, TheSystemsDefaultFollowsItsSockets) {
  const LogDestination expected = std::filesystem::exists("/run/systemd/journal/socket")
                                      ? LogDestination::Journal
                                  : std::filesystem::exists("/dev/log") ? LogDestination::Syslog
                                                                        : LogDestination::StandardError;
  EXPECT_EQ(defaultLogDestination(), expected);
}

TEST(LogDestinationTest, KnowsThreeNames) {
  EXPECT_EQ(logDestinationNamed("journal"), LogDestination::Journal);
  EXPECT_EQ(logDestinationNamed("syslog"), LogDestination::Syslog);
  EXPECT_EQ(logDestinationNamed("stderr"), LogDestination::StandardError);
  EXPECT_EQ(logDestinationNamed("Journal"), std::nullopt);
  EXPECT_EQ(logDestinationNamed(""), std::nullopt);
}

TEST(LogDestinationTest, MakesTheLogThatIsAskedFor) {
  const NoClock clock;
  const auto journal = makeLog(LogDestination::Journal, LogLevel::Debug, clock);
  const auto syslog = makeLog(LogDestination::Syslog, LogLevel::Debug, clock);
  const auto standardError = makeLog(LogDestination::StandardError, LogLevel::Debug, clock);
  EXPECT_NE(dynamic_cast<JournalLog*>(journal.get()), nullptr);
  EXPECT_NE(dynamic_cast<SyslogLog*>(syslog.get()), nullptr);
  EXPECT_NE(dynamic_cast<StderrLog*>(standardError.get()), nullptr);
}

TEST(LogDestinationTest, ALogTakesLinesUpToItsHighestLevel) {
  const NoClock clock;
  const auto log = makeLog(LogDestination::StandardError, LogLevel::Warning, clock);
  EXPECT_TRUE(log->takes(LogLevel::Critical));
  EXPECT_TRUE(log->takes(LogLevel::Warning));
  EXPECT_FALSE(log->takes(LogLevel::Info));
}

TEST(LogLevelTest, ReadsNumbersFromZeroToSeven) {
  EXPECT_EQ(logLevelNamed("0"), static_cast<LogLevel>(0));
  EXPECT_EQ(logLevelNamed("3"), LogLevel::Error);
  EXPECT_EQ(logLevelNamed("7"), LogLevel::Debug);
  for (const std::string_view none : {"8", "-1", "07", "3 ", " 3", "3x", ""})
    EXPECT_EQ(logLevelNamed(none), std::nullopt);
}

TEST(LogLevelTest, ReadsNamesInUpperAndLowerCase) {
  EXPECT_EQ(logLevelNamed("crit"), LogLevel::Critical);
  EXPECT_EQ(logLevelNamed("Critical"), LogLevel::Critical);
  EXPECT_EQ(logLevelNamed("err"), LogLevel::Error);
  EXPECT_EQ(logLevelNamed("ERROR"), LogLevel::Error);
  EXPECT_EQ(logLevelNamed("warning"), LogLevel::Warning);
  EXPECT_EQ(logLevelNamed("info"), LogLevel::Info);
  EXPECT_EQ(logLevelNamed("debug"), LogLevel::Debug);
  EXPECT_EQ(logLevelNamed("loud"), std::nullopt);
}

}  // namespace
}  // namespace tallyd::platform
