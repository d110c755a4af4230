#include "station/DirectoryLock.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <optional>
#include <string>

#include "fakes/TemporaryFolder.h"

namespace tallyd::station {

using testing::AllOf;
using testing::HasSubstr;

namespace {

std::string errorOfLocking(const std::filesystem::path& directory) {
  try {
    const DirectoryLock lock(directory);
    return {};
  } catch (const std::exception& exception) {
    return exception.what();
  }
}

}  // namespace

TEST(DirectoryLockTest, LetsOneIn) {
  const fakes::TemporaryFolder folder;
  const auto directory = folder.path() / "new" / "station";
  std::optional<DirectoryLock> first(std::in_place, directory);
  EXPECT_THAT(errorOfLocking(directory), AllOf(HasSubstr((directory / "station.lock").string()),
                                               HasSubstr("process " + std::to_string(::getpid()) + ",")));
  EXPECT_EQ(errorOfLocking(folder.path() / "other"), "");
  first.reset();
  EXPECT_EQ(errorOfLocking(directory), "");
}

TEST(DirectoryLockTest, NamesTheFileThatCannotBeLocked) {
  const fakes::TemporaryFolder folder;
  std::filesystem::create_directory(folder.path() / "station.lock");
  EXPECT_THAT(errorOfLocking(folder.path()), HasSubstr((folder.path() / "station.lock").string()));
}

}  // namespace tallyd::station
