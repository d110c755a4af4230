#include "platform/settings/FileReading.h"

#include <sys/stat.h>

#include "SettingsFolder.h"

namespace tallyd::platform {
namespace {

using FileReadingTest = SettingsFolder;

TEST_F(FileReadingTest, ReadsAWholeFile) {
  std::string bytes;
  for (int i = 0; i < 100'000; ++i) bytes += static_cast<char>(i * 31);
  write("file", bytes);
  const FileContents contents = readFile(path("file"));
  EXPECT_EQ(contents.bytes, bytes);
  EXPECT_EQ(contents.error, "");
  EXPECT_EQ(contents.status.st_size, 100'000);
  write("empty", "");
  EXPECT_EQ(readFile(path("empty")).bytes, "");
}

TEST_F(FileReadingTest, ReadsFilesThatStateNoSize) {
  const auto contents = readFile("/proc/self/status");
  ASSERT_TRUE(contents.bytes);
  EXPECT_TRUE(contents.bytes->starts_with("Name:"));
}

TEST_F(FileReadingTest, RefusesFilesAboveTheBound) {
  write("file", "12345");
  EXPECT_TRUE(readFile(path("file"), 5).bytes);
  EXPECT_EQ(readFile(path("file"), 4).error, "too large");
  EXPECT_EQ(readFile("/proc/self/status", 10).error, "too large");
}

TEST_F(FileReadingTest, SaysWhyAFileCannotBeRead) {
  const FileContents missing = readFile(path("missing"));
  EXPECT_FALSE(missing.bytes);
  EXPECT_EQ(missing.errorNumber, ENOENT);
  EXPECT_EQ(missing.error, "No such file or directory");
  EXPECT_EQ(readFile(_folder.path()).error, "not a regular file");
  EXPECT_EQ(readFile("/dev/null").error, "not a regular file");
}

TEST_F(FileReadingTest, DoesNotWaitForAPipe) {
  ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
  EXPECT_EQ(readFile(path("pipe")).error, "not a regular file");
}

TEST_F(FileReadingTest, OnlyOneComponentOfAPathIsAPlainFileName) {
  for (const std::string_view name : {"a", "a.b", "...", ".hidden", "a b"})
    EXPECT_TRUE(isPlainFileName(name)) << name;
  for (const std::string_view name :
       {std::string_view(""), std::string_view("."), std::string_view(".."), std::string_view("a/b"),
        std::string_view("/a"), std::string_view("a\0", 2)}) {
    EXPECT_FALSE(isPlainFileName(name)) << name;
  }
}

}  // namespace
}  // namespace tallyd::platform
