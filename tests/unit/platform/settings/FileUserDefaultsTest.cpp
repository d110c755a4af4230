#include "platform/settings/FileUserDefaults.h"

#include <sys/stat.h>

#include <thread>
#include <vector>

#include "SettingsFolder.h"

namespace tallyd::platform {
namespace {

constexpr std::string_view kFile = "var/lib/tallyd/com.quillon.tallyd.plist";

class FileUserDefaultsTest : public SettingsFolder {
 protected:
  [[nodiscard]] std::optional<Value> stored() const { return propertyListWithData(read(kFile)).value; }
  [[nodiscard]] ino_t inode() const {
    struct ::stat status {};
    return ::stat(path(kFile).c_str(), &status) == 0 ? status.st_ino : 0;
  }
  [[nodiscard]] std::size_t filesInFolder() const {
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(path(kFile).parent_path()))
      ++count;
    return count;
  }

  FileUserDefaults _defaults{_root, _log};
};

TEST_F(FileUserDefaultsTest, KeepsValuesOverARestart) {
  const Value value = Dictionary{{"date", Date{1577934245.25}}, {"list", Array{1, "two", Data("3")}}};
  EXPECT_EQ(_defaults.value("key"), std::nullopt);
  _defaults.setValue("key", value);
  EXPECT_EQ(_defaults.value("key"), value);
  FileUserDefaults restarted(_root, _log);
  EXPECT_EQ(restarted.value("key"), value);
  restarted.setValue("key", std::nullopt);
  EXPECT_EQ(restarted.value("key"), std::nullopt);
  EXPECT_EQ(FileUserDefaults(_root, _log).value("key"), std::nullopt);
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FileUserDefaultsTest, KeepsTheValuesThatItFound) {
  writeList(kFile, Dictionary{{"mine", 1}, {"other", "kept"}});
  _defaults.setValue("mine", 2);
  EXPECT_EQ(stored(), Value(Dictionary{{"mine", 2}, {"other", "kept"}}));
}

TEST_F(FileUserDefaultsTest, WritesOnlyWhenAValueChanges) {
  _defaults.setValue("missing", std::nullopt);
  EXPECT_EQ(inode(), 0U);
  _defaults.setValue("key", "value");
  std::filesystem::remove(path(kFile));
  _defaults.setValue("key", "value");
  _defaults.setValue("missing", std::nullopt);
  EXPECT_FALSE(std::filesystem::exists(path(kFile)));
  _defaults.setValue("key", "other");
  EXPECT_EQ(stored(), Value(Dictionary{{"key", "other"}}));
}

TEST_F(FileUserDefaultsTest, ReplacesTheFileInOneStepAndLeavesNothingElse) {
  _defaults.setValue("key", 1);
  std::filesystem::create_hard_link(path(kFile), path("before"));
  _defaults.setValue("key", 2);
  EXPECT_EQ(propertyListWithData(read("before")).value, Value(Dictionary{{"key", 1}}));
  EXPECT_EQ(stored(), Value(Dictionary{{"key", 2}}));
  EXPECT_EQ(filesInFolder(), 1U);
}

TEST_F(FileUserDefaultsTest, ReadsTheFileOnceOnly) {
  writeList(kFile, Dictionary{{"key", "first"}});
  EXPECT_EQ(_defaults.value("key"), Value("first"));
  writeList(kFile, Dictionary{{"key", "second"}});
  EXPECT_EQ(_defaults.value("key"), Value("first"));
}

TEST_F(FileUserDefaultsTest, ABrokenFileIsLoggedCountsAsEmptyAndIsReplaced) {
  write(kFile, "<plist>");
  EXPECT_EQ(_defaults.value("key"), std::nullopt);
  EXPECT_EQ(_defaults.value("key"), std::nullopt);
  ASSERT_EQ(_log.lines().size(), 1U);
  EXPECT_TRUE(_log.hasTextStartingWith(LogLevel::Error,
                                       "Cannot read " + path(kFile).native() + ": XML property list: "));
  _defaults.setValue("key", 1);
  EXPECT_EQ(stored(), Value(Dictionary{{"key", 1}}));
}

TEST_F(FileUserDefaultsTest, AChangeThatCannotBeStoredIsLoggedAndStaysInMemory) {
  write("var/lib/tallyd", "a file where the folder should be");
  _defaults.setValue("key", "value");
  EXPECT_EQ(_defaults.value("key"), Value("value"));
  ASSERT_EQ(_log.lines().size(), 2U);
  EXPECT_EQ(_log.lines()[0].text, "Cannot read " + path(kFile).native() + ": Not a directory");
  EXPECT_EQ(_log.lines()[1].level, LogLevel::Error);
  EXPECT_EQ(_log.lines()[1].text, "Cannot write " + path(kFile).native() + ": Not a directory");
  std::filesystem::remove(path("var/lib/tallyd"));
  _defaults.setValue("second", 2);
  EXPECT_EQ(stored(), Value(Dictionary{{"key", "value"}, {"second", 2}}));
}

TEST_F(FileUserDefaultsTest, AFailedReplacementLeavesNoTemporaryFile) {
  std::filesystem::create_directories(path(kFile) / "in the way");
  _defaults.setValue("key", 1);
  EXPECT_TRUE(_log.has(LogLevel::Error, "Cannot write " + path(kFile).native() + ": Is a directory"));
  EXPECT_EQ(filesInFolder(), 1U);
  EXPECT_EQ(_defaults.value("key"), Value(1));
}

TEST_F(FileUserDefaultsTest, AValueThatNoListCanHoldIsLoggedAndStaysInMemory) {
  _defaults.setValue("key", Value(Array{nullptr}));
  EXPECT_EQ(_defaults.value("key"), Value(Array{nullptr}));
  EXPECT_EQ(
      _log.lines(),
      (std::vector<fakes::FakeLog::Line>{{LogLevel::Error, "Cannot write " + path(kFile).native() +
                                                               ": a value that no property list can hold"}}));
}

TEST_F(FileUserDefaultsTest, StoresTheChangesOfAllThreads) {
  std::vector<std::thread> threads;
  for (int number = 0; number < 4; ++number) {
    threads.emplace_back([this, number] {
      for (int i = 0; i < 10; ++i) {
        const std::string key = std::to_string(number) + "-" + std::to_string(i);
        _defaults.setValue(key, i);
        EXPECT_EQ(_defaults.value(key), Value(i));
      }
    });
  }
  for (auto& thread : threads) thread.join();
  const auto all = stored();
  ASSERT_TRUE(all && all->dictionary());
  EXPECT_EQ(all->dictionary()->size(), 40U);
}

}  // namespace
}  // namespace tallyd::platform
