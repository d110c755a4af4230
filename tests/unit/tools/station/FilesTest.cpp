#include "station/Files.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <system_error>

#include "fakes/TemporaryFolder.h"
#include "support/FileSizeLimit.h"

namespace tallyd::station {

using testing::HasSubstr;

namespace {

/// What an action throws; empty when nothing.
template <class Action>
std::string errorOf(Action&& action) {
  try {
    action();
    return {};
  } catch (const std::system_error& error) {
    return error.what();
  }
}

}  // namespace

class FilesTest : public testing::Test {
 protected:
  fakes::TemporaryFolder folder;
  const std::filesystem::path file = folder.path() / "file";
};

TEST_F(FilesTest, AppendsAndReplaces) {
  appendToFile(file, "one\n");
  appendToFile(file, "two\n");
  EXPECT_EQ(readFile(file), "one\ntwo\n");
  replaceFile(file, "three", 0600);
  EXPECT_EQ(readFile(file), "three");
}

TEST_F(FilesTest, NeverWaitsForAPipe) {
  ASSERT_EQ(::mkfifo(file.c_str(), 0600), 0);
  EXPECT_THAT(errorOf([&] { (void)readFile(file); }), HasSubstr(file.string() + " is not a regular file"));
  EXPECT_THAT(errorOf([&] { appendToFile(file, "x"); }), HasSubstr(file.string() + " is not a regular file"));
}

TEST_F(FilesTest, RefusesFoldersAndWhatIsMissing) {
  EXPECT_THAT(errorOf([&] { (void)readFile(folder.path()); }), HasSubstr("is not a regular file"));
  EXPECT_THAT(errorOf([&] { (void)readFile(file); }), HasSubstr(file.string()));
}

TEST_F(FilesTest, LeavesNoPartOfWhatDoesNotFit) {
  appendToFile(file, "1234\n");
  std::string error;
  {
    const test::FileSizeLimit limit(8);
    error = errorOf([&] { appendToFile(file, "123456\n"); });
  }
  EXPECT_THAT(error, HasSubstr(file.string()));
  EXPECT_EQ(readFile(file), "1234\n");
}

}  // namespace tallyd::station
