#include "platform/AppendWhole.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

#include "fakes/TemporaryFolder.h"
#include "platform/FileDescriptor.h"
#include "support/FileSizeLimit.h"

namespace tallyd::platform {
namespace {

class AppendWholeTest : public testing::Test {
 protected:
  [[nodiscard]] FileDescriptor opened() const {
    return FileDescriptor(::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600));
  }
  [[nodiscard]] std::string content() const {
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
  }

  fakes::TemporaryFolder folder;
  const std::filesystem::path path = folder.path() / "file";
};

TEST_F(AppendWholeTest, AppendsToWhatIsThere) {
  std::ofstream(path) << "one\n";
  const FileDescriptor file = opened();
  EXPECT_FALSE(appendWhole(file.get(), "two\n"));
  EXPECT_FALSE(appendWhole(file.get(), ""));
  EXPECT_FALSE(appendWhole(file.get(), "three\n"));
  EXPECT_EQ(content(), "one\ntwo\nthree\n");
}

TEST_F(AppendWholeTest, TakesBackWhatItWroteOfATextForWhichThereIsNoRoom) {
  std::ofstream(path) << "one\n";
  const FileDescriptor file = opened();
  {
    const test::FileSizeLimit limit(7);
    EXPECT_EQ(appendWhole(file.get(), "two and more\n"), std::errc::file_too_large);
    EXPECT_EQ(content(), "one\n");
    EXPECT_FALSE(appendWhole(file.get(), "2\n"));
  }
  EXPECT_FALSE(appendWhole(file.get(), "three\n"));
  EXPECT_EQ(content(), "one\n2\nthree\n");
}

TEST_F(AppendWholeTest, SaysWhyNothingCouldBeWritten) {
  const FileDescriptor full(::open("/dev/full", O_WRONLY | O_APPEND | O_CLOEXEC));
  EXPECT_EQ(appendWhole(full.get(), "x"), std::errc::no_space_on_device);
  EXPECT_EQ(appendWhole(-1, "x"), std::errc::bad_file_descriptor);
}

TEST_F(AppendWholeTest, SaysWhyAPartHasToStay) {
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
  const FileDescriptor reader(ends[0]);
  const FileDescriptor writer(ends[1]);
  const std::string text(std::size_t{1} << 20, 'x');  // More than a pipe holds.
  EXPECT_EQ(appendWhole(writer.get(), text), std::errc::invalid_seek);
}

}  // namespace
}  // namespace tallyd::platform
