#include "support/MessageLog.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <sstream>
#include <thread>

#include "fakes/FakePlatform.h"
#include "fakes/TooLarge.h"
#include "support/FileSizeLimit.h"

namespace tallyd {
namespace {

using fakes::FakePlatform;
using platform::Date;
using platform::LogLevel;
using platform::Value;

constexpr const char* kFolder = "/var/mobile/Library/Logs/CrashReporter/Retired";

class MessageLogTest : public testing::Test {
 protected:
  MessageLogTest() {
    // Files of the test are made at the true time: the clock starts there and moves from there.
    fake.clock.set(std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::system_clock::now().time_since_epoch()));
  }

  std::string folder() const { return fake.root.under(kFolder).string(); }
  std::string path(const std::string& name) const { return folder() + "/" + name; }
  std::string currentName() const {
    return "tallyd_" + std::to_string(fake.clock.timeOfDay().tv_sec) + "_messageLog.diag";
  }
  std::string now() const { return Value(platform::dateFromTimePoint(fake.clock.now())).description(); }
  void makeFile(const std::string& name, const std::string& content = "") {
    std::filesystem::create_directories(folder());
    std::ofstream(path(name)) << content;
  }
  void save(std::optional<Value> savedPath, std::optional<Value> date) {
    fake.defaults.setValue("logFilePath", std::move(savedPath));
    fake.defaults.setValue("logFileCreationDate", std::move(date));
  }
  Value dateAgo(double seconds) const { return Date{platform::secondsSince1970(fake.clock.now()) - seconds}; }
  static std::string read(const std::string& file) {
    std::ostringstream text;
    text << std::ifstream(file).rdbuf();
    return text.str();
  }
  std::vector<std::string> files() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(folder())) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
  std::optional<std::string> savedPath() const {
    const auto value = fake.defaults.value("logFilePath");
    return value ? std::optional(std::string(*value->string())) : std::nullopt;
  }
  bool hasSavedDate() const { return fake.defaults.value("logFileCreationDate").has_value(); }
  bool logged(LogLevel level, const std::string& text) const { return fake.log.has(level, text); }

  FakePlatform fake;
  MessageLog log{fake.platform};
};

TEST_F(MessageLogTest, MakesDirectoryAndFileAtTheFirstCall) {
  log.writeMessageLog("hello");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_EQ(read(path(currentName())), "(" + now() + ") hello\n");
  EXPECT_EQ(savedPath(), path(currentName()));
  EXPECT_TRUE(hasSavedDate());
  std::vector<std::string> texts;
  for (const auto& line : fake.log.lines()) {
    EXPECT_EQ(line.level, LogLevel::Info);
    texts.push_back(line.text);
  }
  ASSERT_EQ(texts.size(), 5U);
  EXPECT_EQ(texts[0], "Checking for tallyd log directory " + folder());
  EXPECT_EQ(texts[1], "Creating tallyd log directory " + folder());
  EXPECT_EQ(texts[2], "Searching for existing tallyd log file in " + folder());
  EXPECT_TRUE(texts[3].starts_with("Created new tallyd log file " + path(currentName()) + " (")) << texts[3];
  EXPECT_EQ(texts[4], "Saved log message to " + path(currentName()));
}

TEST_F(MessageLogTest, LosesALineForWhichThereIsNoMemoryAndNoOther) {
  log.writeMessageLog("one");
  log.writeMessageLog("{}", fakes::TooLarge());
  log.writeMessageLog("three");
  EXPECT_EQ(read(path(currentName())), "(" + now() + ") one\n(" + now() + ") three\n");
  EXPECT_TRUE(logged(LogLevel::Critical, "No memory for a line of the tallyd log file"));
}

TEST_F(MessageLogTest, StampsALineWithDateTimeAndOffset) {
  fake.clock.set(std::chrono::seconds(1'763'280'000));
  log.writeMessageLog("x");
  EXPECT_EQ(read(path("tallyd_1763280000_messageLog.diag")), "(2025-11-16 08:00:00 +0000) x\n");
}

TEST_F(MessageLogTest, ChecksTheDirectoryOncePerProcess) {
  std::filesystem::create_directories(folder());
  log.writeMessageLog("one");
  log.writeMessageLog("two");
  EXPECT_EQ(fake.log.count(LogLevel::Info, "Checking for tallyd log directory " + folder()), 1U);
  EXPECT_EQ(fake.log.count(LogLevel::Info, "Found tallyd log directory " + folder()), 1U);
}

TEST_F(MessageLogTest, AppendsToTheCurrentFile) {
  log.writeMessageLog("one");
  const std::string name = currentName();
  fake.clock.advance(std::chrono::seconds(5));
  log.writeMessageLog("{} -> {}", "two", 2);
  EXPECT_EQ(files(), std::vector{name});
  EXPECT_TRUE(read(path(name)).ends_with(") two -> 2\n"));
  EXPECT_EQ(fake.log.count(LogLevel::Info, "Searching for existing tallyd log file in " + folder()), 1U);
}

TEST_F(MessageLogTest, KeepsAFileOfExactlyADay) {
  makeFile("tallyd_5_messageLog.diag", "old\n");
  save(path("tallyd_5_messageLog.diag"), dateAgo(86'400));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector<std::string>{"tallyd_5_messageLog.diag"});
  EXPECT_EQ(read(path("tallyd_5_messageLog.diag")), "old\n(" + now() + ") x\n");
}

TEST_F(MessageLogTest, ReplacesAFileASecondOlderThanADay) {
  makeFile("tallyd_5_messageLog.diag", "old\n");
  const Value date = dateAgo(86'401);
  save(path("tallyd_5_messageLog.diag"), date);
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_TRUE(logged(LogLevel::Info, "Deleting expired tallyd log file " + path("tallyd_5_messageLog.diag") +
                                         " (" + date.description() + ")"));
}

TEST_F(MessageLogTest, ReplacesItsOwnFileWhenItIsADayOld) {
  log.writeMessageLog("x");
  const std::string first = currentName();
  fake.clock.advance(std::chrono::seconds(86'402));
  log.writeMessageLog("y");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_NE(currentName(), first);
}

// The saved state: a path or none (or one that is gone), a date or none, and a file in the directory or none.

TEST_F(MessageLogTest, UsesASavedFileThatIsThere) {
  makeFile("tallyd_5_messageLog.diag");
  save(path("tallyd_5_messageLog.diag"), dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_EQ(files().size(), 1U);
  EXPECT_FALSE(fake.log.hasTextStartingWith(LogLevel::Info, "Searching"));
}

TEST_F(MessageLogTest, SearchesWhenTheSavedFileIsGone) {
  makeFile("tallyd_7_messageLog.diag");
  save(path("tallyd_5_messageLog.diag"), dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_TRUE(logged(LogLevel::Info, "Saved tallyd log file " + path("tallyd_5_messageLog.diag") +
                                         " not found - invalidating file path"));
  EXPECT_TRUE(logged(LogLevel::Info, "Searching for existing tallyd log file in " + folder()));
  EXPECT_TRUE(fake.log.hasTextStartingWith(
      LogLevel::Info, "Found existing tallyd log file " + path("tallyd_7_messageLog.diag") + " ("));
  EXPECT_EQ(savedPath(), path("tallyd_7_messageLog.diag"));
  EXPECT_TRUE(hasSavedDate());
}

TEST_F(MessageLogTest, MakesANewFileWhenTheSavedOneIsGoneAndNoOtherIsThere) {
  std::filesystem::create_directories(folder());
  save(path("tallyd_5_messageLog.diag"), dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_EQ(savedPath(), path(currentName()));
}

TEST_F(MessageLogTest, FindsTheFileWhenNothingIsSaved) {
  makeFile("tallyd_7_messageLog.diag");
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector<std::string>{"tallyd_7_messageLog.diag"});
  EXPECT_EQ(savedPath(), path("tallyd_7_messageLog.diag"));
}

TEST_F(MessageLogTest, FindsAnExpiredFileAndReplacesIt) {
  makeFile("tallyd_7_messageLog.diag");
  fake.clock.advance(std::chrono::seconds(86'405));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_TRUE(fake.log.hasTextStartingWith(
      LogLevel::Info, "Deleting expired tallyd log file " + path("tallyd_7_messageLog.diag")));
}

TEST_F(MessageLogTest, TakesAnotherFileWhenTheSavedOneHasLostItsDate) {
  makeFile("tallyd_7_messageLog.diag");
  const std::string elsewhere = (fake.folder.path() / "elsewhere").string();
  std::ofstream(elsewhere) << "";
  save(elsewhere, std::nullopt);
  log.writeMessageLog("x");
  EXPECT_EQ(savedPath(), path("tallyd_7_messageLog.diag"));
  EXPECT_EQ(read(elsewhere), "");
}

TEST_F(MessageLogTest, WritesToASavedFileWithoutADateAndLeavesTheDateUnset) {
  std::filesystem::create_directories(folder());
  const std::string elsewhere = (fake.folder.path() / "elsewhere").string();
  std::ofstream(elsewhere) << "";
  save(elsewhere, std::nullopt);
  log.writeMessageLog("x");
  EXPECT_EQ(read(elsewhere), "(" + now() + ") x\n");
  EXPECT_EQ(savedPath(), elsewhere);
  EXPECT_FALSE(hasSavedDate());
  EXPECT_TRUE(files().empty());
}

TEST_F(MessageLogTest, MakesANewFileForADateWithoutAPath) {
  std::filesystem::create_directories(folder());
  save(std::nullopt, dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector{currentName()});
  EXPECT_FALSE(fake.log.hasTextStartingWith(LogLevel::Info, "Deleting"));
}

TEST_F(MessageLogTest, TakesAnExpiredDateWithoutAPathForAFileThatIsGone) {
  std::filesystem::create_directories(folder());
  const Value date = dateAgo(86'401);
  save(std::nullopt, date);
  log.writeMessageLog("x");
  EXPECT_TRUE(logged(LogLevel::Info, "Deleting expired tallyd log file (null) (" + date.description() + ")"));
  EXPECT_EQ(files(), std::vector{currentName()});
}

TEST_F(MessageLogTest, FindsAFileForADateWithoutAPath) {
  makeFile("tallyd_7_messageLog.diag");
  save(std::nullopt, dateAgo(86'401));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector<std::string>{"tallyd_7_messageLog.diag"});
}

TEST_F(MessageLogTest, PassesOverSavedValuesOfTheWrongKind) {
  save(Value(5), Value("yesterday"));
  log.writeMessageLog("x");
  EXPECT_EQ(files(), std::vector{currentName()});
}

// Failures.

TEST_F(MessageLogTest, LosesTheMessageAndForgetsWhenNoFileCanBeMade) {
  std::filesystem::create_directories(fake.root.under(kFolder).parent_path());
  std::ofstream(folder()) << "a file where the folder belongs";
  save(std::nullopt, dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_TRUE(logged(LogLevel::Critical, "Error reading from log directory: Not a directory"));
  EXPECT_TRUE(logged(LogLevel::Critical, "Failed to create new tallyd log file " + path(currentName())));
  EXPECT_EQ(savedPath(), std::nullopt);
  EXPECT_FALSE(hasSavedDate());
  EXPECT_FALSE(fake.log.hasTextStartingWith(LogLevel::Info, "Saved log message"));

  std::filesystem::remove(folder());
  log.writeMessageLog("y");
  EXPECT_EQ(read(path(currentName())), "(" + now() + ") y\n");
}

TEST_F(MessageLogTest, MakesADirectoryThatWentAwayAnew) {
  log.writeMessageLog("x");
  std::filesystem::remove_all(folder());
  log.writeMessageLog("y");
  EXPECT_TRUE(logged(LogLevel::Info, "Creating tallyd log directory at " + folder()));
  EXPECT_EQ(read(path(currentName())), "(" + now() + ") y\n");
}

TEST_F(MessageLogTest, SaysWhenALineCouldNotBeWritten) {
  const std::string full = "/dev/full";
  save(full, dateAgo(60));
  log.writeMessageLog("x");
  EXPECT_TRUE(
      logged(LogLevel::Critical, "Error writing to tallyd log file /dev/full: No space left on device"));
  EXPECT_TRUE(logged(LogLevel::Info, "Saved log message to /dev/full"));
}

TEST_F(MessageLogTest, LosesALineForWhichThereIsNoRoomAsAWhole) {
  log.writeMessageLog("one");
  const std::string first = read(path(currentName()));
  {
    const test::FileSizeLimit limit(first.size() + 10);
    log.writeMessageLog("two");
  }
  log.writeMessageLog("three");
  EXPECT_EQ(read(path(currentName())), first + "(" + now() + ") three\n");
  EXPECT_TRUE(logged(LogLevel::Critical,
                     "Error writing to tallyd log file " + path(currentName()) + ": File too large"));
}

TEST_F(MessageLogTest, WritesToTheFileThatHasTakenTheCurrentOnesPlace) {
  log.writeMessageLog("one");
  const auto current = path(currentName());
  const auto other = folder() + "/other";
  std::ofstream(other) << "before\n";
  std::filesystem::rename(other, current);
  log.writeMessageLog("two");
  log.writeMessageLog("three");
  EXPECT_EQ(read(current), "before\n(" + now() + ") two\n(" + now() + ") three\n");
}

TEST_F(MessageLogTest, LeavesAFileThatWasDeletedBetweenTwoLines) {
  log.writeMessageLog("one");
  std::filesystem::remove(path(currentName()));
  fake.clock.advance(std::chrono::seconds(1));
  log.writeMessageLog("two");
  EXPECT_EQ(read(path(currentName())), "(" + now() + ") two\n");
}

TEST_F(MessageLogTest, StampsLinesOfOneSecondAlikeAndOfTheNextAnew) {
  log.writeMessageLog("one");
  const std::string file = path(currentName());
  const std::string first = now();
  fake.clock.advance(std::chrono::milliseconds(1000));
  log.writeMessageLog("two");
  ASSERT_NE(first, now());
  EXPECT_EQ(read(file), "(" + first + ") one\n(" + now() + ") two\n");
}

TEST_F(MessageLogTest, SerialisesCallsOfManyThreads) {
  {
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread) {
      threads.emplace_back([this] {
        for (int i = 0; i < 50; ++i) log.writeMessageLog("0123456789");
      });
    }
  }
  std::istringstream lines(read(path(currentName())));
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count)
    EXPECT_TRUE(line.ends_with(") 0123456789")) << line;
  EXPECT_EQ(count, 200);
}

TEST(MessageLogFileNameTest, HasThreePartsTheFirstAndTheThirdFixed) {
  EXPECT_TRUE(isMessageLogFileName("tallyd_5_messageLog.diag"));
  EXPECT_TRUE(isMessageLogFileName("tallyd__messageLog.diag"));
  EXPECT_FALSE(isMessageLogFileName("tallyd_5_messageLog.diag.old"));
  EXPECT_FALSE(isMessageLogFileName("tallyd_messageLog.diag"));
  EXPECT_FALSE(isMessageLogFileName("tallyd_5_6_messageLog.diag"));
  EXPECT_FALSE(isMessageLogFileName("Tallyd_5_messageLog.diag"));
  EXPECT_FALSE(isMessageLogFileName("_tallyd_5_messageLog.diag"));
}

}  // namespace
}  // namespace tallyd
