#include "platform/power-log/FilePowerLog.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <sstream>
#include <system_error>
#include <thread>
#include <vector>

#include "fakes/FakeClock.h"
#include "fakes/FakeLog.h"
#include "fakes/TemporaryFolder.h"
#include "platform/JSON.h"
#include "platform/power-log/PowerLogLine.h"
#include "support/FileSizeLimit.h"

namespace tallyd::platform {
namespace {

namespace fs = std::filesystem;

class FilePowerLogTest : public testing::Test {
 protected:
  static std::string textOf(const fs::path& path) {
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
  }
  static void logEvent(PowerLog& powerLog, int event) {
    powerLog.WBLogRegisteredEvent(28, "StagehostD-RTC", {{"event", event}});
  }
  static void expectLost(PowerLog& powerLog, int event) {
    EXPECT_THROW(logEvent(powerLog, event), std::system_error);
  }
  [[nodiscard]] std::string lineOf(int event) const {
    return powerLogLine(clock.now(), 28, "StagehostD-RTC", {{"event", event}});
  }

  fakes::TemporaryFolder folder;
  Root root{folder.path()};
  fs::path path = root.under("/var/log/tallyd/power.jsonl");
  fs::path retired = root.under("/var/log/tallyd/power.jsonl.1");
  fakes::FakeClock clock;
  fakes::FakeLog log;
};

TEST_F(FilePowerLogTest, TouchesNoFileUntilTheFirstEvent) {
  const FilePowerLog powerLog(root, clock, log);
  EXPECT_FALSE(fs::exists(root.under("/var")));
}

TEST_F(FilePowerLogTest, AppendsOneLinePerEvent) {
  FilePowerLog powerLog(root, clock, log);
  logEvent(powerLog, 1);
  const std::string first = lineOf(1);
  clock.advance(std::chrono::seconds(3));
  logEvent(powerLog, 2);
  EXPECT_EQ(textOf(path), first + lineOf(2));
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(FilePowerLogTest, GoesOnWithTheFileOfAnEarlierProcess) {
  for (const int event : {1, 2}) {
    FilePowerLog powerLog(root, clock, log);
    logEvent(powerLog, event);
  }
  EXPECT_EQ(textOf(path), lineOf(1) + lineOf(2));
}

TEST_F(FilePowerLogTest, KeepsTheFileFromOtherUsers) {
  FilePowerLog powerLog(root, clock, log);
  logEvent(powerLog, 1);
  struct stat status {};
  ASSERT_EQ(::stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07, 0U);
}

TEST_F(FilePowerLogTest, BeginsANewFileWhenALineWouldPassTheLimit) {
  FilePowerLog powerLog(root, clock, log, lineOf(1).size() * 2);
  logEvent(powerLog, 1);
  logEvent(powerLog, 2);
  EXPECT_FALSE(fs::exists(retired));
  logEvent(powerLog, 3);
  EXPECT_EQ(textOf(retired), lineOf(1) + lineOf(2));
  EXPECT_EQ(textOf(path), lineOf(3));
}

TEST_F(FilePowerLogTest, KeepsOneRetiredFile) {
  FilePowerLog powerLog(root, clock, log, lineOf(1).size());
  for (const int event : {1, 2, 3}) logEvent(powerLog, event);
  EXPECT_EQ(textOf(retired), lineOf(2));
  EXPECT_EQ(textOf(path), lineOf(3));
  EXPECT_EQ(std::distance(fs::directory_iterator(path.parent_path()), {}), 2);
}

TEST_F(FilePowerLogTest, WritesALineLargerThanTheLimitToAFileOfItsOwn) {
  FilePowerLog powerLog(root, clock, log, 10);
  logEvent(powerLog, 1);
  EXPECT_EQ(textOf(path), lineOf(1));
  EXPECT_FALSE(fs::exists(retired));
}

TEST_F(FilePowerLogTest, BeginsANewFileWhenTheOldOneWasMovedAway) {
  FilePowerLog powerLog(root, clock, log);
  logEvent(powerLog, 1);
  fs::rename(path, folder.path() / "moved");
  logEvent(powerLog, 2);
  EXPECT_EQ(textOf(path), lineOf(2));
}

TEST_F(FilePowerLogTest, LogsTheFirstOfARowOfFailures) {
  FilePowerLog powerLog(root, clock, log);
  fs::create_directories(path);  // A folder in the file's place.
  expectLost(powerLog, 1);
  expectLost(powerLog, 2);
  const std::string line = "Can't write the power log " + path.string() + ": open: Is a directory";
  EXPECT_EQ(log.lines(), (std::vector<fakes::FakeLog::Line>{{LogLevel::Warning, line}}));
  fs::remove(path);
  logEvent(powerLog, 3);
  EXPECT_EQ(textOf(path), lineOf(3));
  fs::remove(path);
  fs::create_directories(path);
  expectLost(powerLog, 4);
  EXPECT_EQ(log.count(LogLevel::Warning, line), 2U);
}

TEST_F(FilePowerLogTest, LosesALineForWhichThereIsNoRoomAsAWhole) {
  FilePowerLog powerLog(root, clock, log);
  logEvent(powerLog, 1);
  {
    const test::FileSizeLimit limit(lineOf(1).size() + 10);
    expectLost(powerLog, 2);
  }
  logEvent(powerLog, 3);
  EXPECT_EQ(textOf(path), lineOf(1) + lineOf(3));
  EXPECT_TRUE(
      log.has(LogLevel::Warning, "Can't write the power log " + path.string() + ": write: File too large"));
}

TEST_F(FilePowerLogTest, NeitherWaitsForAPipeNorFollowsALink) {
  FilePowerLog powerLog(root, clock, log);
  fs::create_directories(path.parent_path());
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  expectLost(powerLog, 1);
  fs::remove(path);
  fs::create_symlink(folder.path() / "elsewhere", path);
  expectLost(powerLog, 2);
  EXPECT_FALSE(fs::exists(folder.path() / "elsewhere"));
  EXPECT_EQ(log.lines().size(), 1U);
}

TEST_F(FilePowerLogTest, SurvivesAFolderThatCannotBeMade) {
  FilePowerLog powerLog(root, clock, log);
  std::ofstream(root.under("/var")) << "a file";
  expectLost(powerLog, 1);
  EXPECT_TRUE(log.hasTextStartingWith(LogLevel::Warning, "Can't write the power log " + path.string()));
}

TEST_F(FilePowerLogTest, KeepsLinesWholeWhenManyThreadsWrite) {
  constexpr int kThreads = 4;
  constexpr int kEvents = 50;
  FilePowerLog powerLog(root, clock, log, kThreads * kEvents * lineOf(100).size() * 3 / 4);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&] {
      for (int event = 0; event < kEvents; ++event) logEvent(powerLog, event);
    });
  }
  for (auto& thread : threads) thread.join();
  std::istringstream lines(textOf(retired) + textOf(path));
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    EXPECT_TRUE(valueFromJSON(line).value) << line;
  }
  EXPECT_EQ(count, kThreads * kEvents);
  EXPECT_TRUE(fs::exists(retired));
}

}  // namespace
}  // namespace tallyd::platform
