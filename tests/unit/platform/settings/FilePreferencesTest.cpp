#include "platform/settings/FilePreferences.h"

#include <sys/stat.h>

#include <thread>
#include <vector>

#include "SettingsFolder.h"
#include "platform/settings/PropertyListFile.h"
#include "support/FewDescriptors.h"

namespace tallyd::platform {
namespace {

constexpr std::string_view kSuite = "com.example.suite";
constexpr std::string_view kFile = "etc/tally/preferences/com.example.suite.plist";

class FilePreferencesTest : public SettingsFolder {
 protected:
  [[nodiscard]] std::optional<Value> value(std::string_view key) const {
    return _preferences.value(kSuite, key);
  }
  [[nodiscard]] std::string fullPath() const { return path(kFile).native(); }

  FilePreferences _preferences{_root, _log};
};

TEST_F(FilePreferencesTest, ReadsEveryFormOfASuite) {
  const Value contents = Dictionary{{"flag", true}, {"count", 5}};
  writeList(kFile, contents);
  EXPECT_EQ(value("flag"), Value(true));
  writeList(kFile, contents, PropertyListFormat::Binary);
  EXPECT_EQ(value("count"), Value(5));
  write(kFile, "{ flag = YES; text = \"a b\"; }");
  EXPECT_EQ(value("flag"), Value("YES"));
  EXPECT_EQ(value("text"), Value("a b"));
  EXPECT_EQ(value("count"), std::nullopt);
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FilePreferencesTest, AMissingFileHasNoValuesAndIsNotLogged) {
  EXPECT_EQ(value("flag"), std::nullopt);
  writeList(kFile, Dictionary{{"flag", true}});
  EXPECT_EQ(value("flag"), Value(true));
  EXPECT_EQ(value("other"), std::nullopt);
  std::filesystem::remove(path(kFile));
  EXPECT_EQ(value("flag"), std::nullopt);
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FilePreferencesTest, SuitesAreApart) {
  writeList("etc/tally/preferences/a.plist", Dictionary{{"key", "of a"}});
  writeList("etc/tally/preferences/b.plist", Dictionary{{"key", "of b"}});
  EXPECT_EQ(_preferences.value("a", "key"), Value("of a"));
  EXPECT_EQ(_preferences.value("b", "key"), Value("of b"));
}

TEST_F(FilePreferencesTest, SeesAChangeOfSizeWithTheSameTime) {
  writeList(kFile, Dictionary{{"key", "short"}});
  setModified(kFile, 1000, 0);
  EXPECT_EQ(value("key"), Value("short"));
  writeList(kFile, Dictionary{{"key", "longer"}});
  setModified(kFile, 1000, 0);
  EXPECT_EQ(value("key"), Value("longer"));
}

TEST_F(FilePreferencesTest, SeesAChangeOfANanosecondWithTheSameSize) {
  writeList(kFile, Dictionary{{"key", "one"}});
  setModified(kFile, 1000, 5);
  EXPECT_EQ(value("key"), Value("one"));
  writeList(kFile, Dictionary{{"key", "two"}});
  setModified(kFile, 1000, 6);
  EXPECT_EQ(value("key"), Value("two"));
}

TEST_F(FilePreferencesTest, SeesAnotherFileInItsPlace) {
  writeList(kFile, Dictionary{{"key", "one"}});
  setModified(kFile, 1000, 5);
  EXPECT_EQ(value("key"), Value("one"));
  writeList("etc/other", Dictionary{{"key", "two"}});
  setModified("etc/other", 1000, 5);
  std::filesystem::rename(path("etc/other"), path(kFile));
  EXPECT_EQ(value("key"), Value("two"));
}

TEST_F(FilePreferencesTest, ABrokenFileIsLoggedOnceForEachChange) {
  write(kFile, "{ key = ");
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(value("key"), std::nullopt);
  const fakes::FakeLog::Line first{
      LogLevel::Error,
      "Cannot read " + fullPath() + ": ASCII property list: the list ends where a value is due at byte 8"};
  EXPECT_EQ(_log.lines(), std::vector{first});
  write(kFile, "( array, at, the, top )");
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(value("key"), std::nullopt);
  const fakes::FakeLog::Line second{
      LogLevel::Error, "Cannot read " + fullPath() + ": property list: no dictionary at the top"};
  EXPECT_EQ(_log.lines(), (std::vector{first, second}));
  write(kFile, "{ key = repaired; }");
  EXPECT_EQ(value("key"), Value("repaired"));
  EXPECT_EQ(_log.lines().size(), 2U);
}

TEST_F(FilePreferencesTest, ABrokenFileDoesNotKeepWhatItHeldBefore) {
  writeList(kFile, Dictionary{{"key", "old"}});
  EXPECT_EQ(value("key"), Value("old"));
  write(kFile, "");
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_TRUE(_log.has(LogLevel::Error, "Cannot read " + fullPath() + ": property list: empty"));
}

TEST_F(FilePreferencesTest, AnUnreadableFileIsLoggedOnce) {
  std::filesystem::create_directories(path(kFile));
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(_log.lines(), (std::vector<fakes::FakeLog::Line>{
                              {LogLevel::Error, "Cannot read " + fullPath() + ": not a regular file"}}));
}

TEST_F(FilePreferencesTest, AFileThatCannotBeReadForTheMomentIsReadOnceItCan) {
  writeList(kFile, Dictionary{{"key", "value"}});
  {
    const test::FewDescriptors none(0);
    EXPECT_EQ(value("key"), std::nullopt);
    EXPECT_EQ(value("key"), std::nullopt);
  }
  EXPECT_EQ(_log.lines(), (std::vector<fakes::FakeLog::Line>{
                              {LogLevel::Error, "Cannot read " + fullPath() + ": Too many open files"}}));
  EXPECT_EQ(value("key"), Value("value"));
  writeList(kFile, Dictionary{{"key", "another"}});
  {
    const test::FewDescriptors none(0);
    EXPECT_EQ(value("key"), std::nullopt);
  }
  EXPECT_EQ(_log.lines().size(), 2U);
  EXPECT_EQ(value("key"), Value("another"));
}

TEST_F(FilePreferencesTest, AFileWhoseStatusCannotBeReadIsLoggedOnce) {
  std::filesystem::create_directories(path(kFile).parent_path());
  std::filesystem::create_symlink(path(kFile), path(kFile));
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(value("key"), std::nullopt);
  EXPECT_EQ(_log.lines(),
            (std::vector<fakes::FakeLog::Line>{
                {LogLevel::Error, "Cannot read " + fullPath() + ": Too many levels of symbolic links"}}));
}

TEST_F(FilePreferencesTest, RefusesSuitesThatAreNoPlainFileName) {
  writeList("etc/tally/secret.plist", Dictionary{{"key", "secret"}});
  writeList("etc/tally/preferences/folder/inner.plist", Dictionary{{"key", "inner"}});
  for (const char* suite : {"../secret", "folder/inner", "/etc/x", "", ".", ".."}) {
    EXPECT_EQ(_preferences.value(suite, "key"), std::nullopt) << suite;
  }
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FilePreferencesTest, AnswersAnyNumberOfThreadsWhileTheFileChanges) {
  writeList(kFile, Dictionary{{"a", 0}, {"b", 0}});
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([this] {
      for (int round = 0; round < 200; ++round) {
        const auto found = value("a");
        ASSERT_TRUE(found && found->isInteger());
      }
    });
  }
  for (int i = 1; i < 50; ++i) {
    writeList("etc/next", Dictionary{{"a", i}, {"b", i}});
    std::filesystem::rename(path("etc/next"), path(kFile));
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(value("b"), Value(49));
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FilePreferencesTest, TheSharedFileGivesItsWholeDictionary) {
  writeList("list.plist", Dictionary{{"a", 1}});
  const PropertyListFile file(path("list.plist"), _log);
  EXPECT_EQ(file.contents(), (Dictionary{{"a", 1}}));
  EXPECT_EQ(file.value("a"), Value(1));
  EXPECT_EQ(file.value("b"), std::nullopt);
}

}  // namespace
}  // namespace tallyd::platform
