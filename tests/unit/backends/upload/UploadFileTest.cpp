#include "backends/upload/UploadFile.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>

#include "fakes/FakeLog.h"
#include "fakes/FakeSandbox.h"
#include "fakes/TemporaryFolder.h"
#include "platform/sandbox/LinuxSandbox.h"

namespace tallyd {
namespace {

namespace fs = std::filesystem;
using platform::FileDescriptor;

class UploadFileTest : public testing::Test {
 protected:
  fs::path write(const std::string& name, const std::string& text) {
    std::ofstream(folder.path() / name, std::ios::binary) << text;
    return folder.path() / name;
  }
  UploadFile open(const fs::path& path) { return UploadFile::open(sandbox, path.string()); }

  fakes::TemporaryFolder folder;
  fakes::FakeSandbox sandbox;
};

TEST_F(UploadFileTest, HoldsTheWholeFile) {
  const std::string bytes = std::string("\0a\xFF", 3) + std::string(200'000, 'x');
  const UploadFile file = open(write("a", bytes));
  EXPECT_TRUE(file.isRegular);
  EXPECT_EQ(file.bytes, bytes.size());
  EXPECT_EQ(file.contents(), bytes);
}

TEST_F(UploadFileTest, LeavesOutWhatIsAppendedWhileItIsRead) {
  const auto path = write("a", "before");
  const UploadFile file = open(path);
  std::ofstream(path, std::ios::app) << "after";
  EXPECT_EQ(file.contents(), "before");
}

TEST_F(UploadFileTest, EndsWhereAFileThatWasCutShortEnds) {
  const auto path = write("a", "before");
  const UploadFile file = open(path);
  fs::resize_file(path, 3);
  EXPECT_EQ(file.contents(), "bef");
}

TEST_F(UploadFileTest, IsRegularOnlyForAFile) {
  fs::create_directory(folder.path() / "folder");
  ASSERT_EQ(::mkfifo((folder.path() / "pipe").c_str(), 0600), 0);
  fs::create_symlink(write("a", "text"), folder.path() / "link");
  fs::create_symlink(folder.path() / "nowhere", folder.path() / "dangling");
  for (const char* other : {"folder", "pipe", "link", "dangling", "missing", "a/below"}) {
    EXPECT_FALSE(open(folder.path() / other).isRegular) << other;
  }
  EXPECT_FALSE(open("/dev/null").isRegular);
  EXPECT_FALSE(open("/dev/zero").isRegular);
  EXPECT_FALSE(open("").isRegular);
}

TEST_F(UploadFileTest, IsNotTheFileUpToAZeroByte) {
  EXPECT_FALSE(open(write("a", "text").string() + std::string("\0b", 2)).isRegular);
}

TEST_F(UploadFileTest, IsEmptyForAFileOfTheKernelsThatStatesNoSize) {
  const UploadFile file = open("/proc/self/status");
  EXPECT_TRUE(file.isRegular);
  EXPECT_EQ(file.contents(), "");
}

/// Opens nothing, as a file system does for who has no right to read.
class ClosedSandbox : public fakes::FakeSandbox {
  FileDescriptor openForReading(std::string_view) override { return {}; }
};

TEST_F(UploadFileTest, IsRegularButEmptyWhenItCannotBeRead) {
  ClosedSandbox closed;
  const UploadFile file = UploadFile::open(closed, write("a", "text"));
  EXPECT_TRUE(file.isRegular);
  EXPECT_FALSE(file.descriptor);
  EXPECT_EQ(file.bytes, 0U);
  EXPECT_EQ(file.contents(), "");
}

/// Files that a client passed, under paths that the daemon does not see.
class PassedUploadFileTest : public UploadFileTest {
 protected:
  UploadFile openPassed(const fs::path& path, int flags) {
    std::vector<FileDescriptor> descriptors;
    descriptors.emplace_back(::open(path.c_str(), flags | O_CLOEXEC));
    EXPECT_TRUE(descriptors.front());
    const auto grant = granting.offerGrant("tally.file:/not/here", std::move(descriptors));
    const auto handle = granting.sandbox_extension_consume("tally.file:/not/here");
    UploadFile file = UploadFile::open(granting, "/not/here");
    granting.sandbox_extension_release(handle);
    return file;
  }

  platform::Root root{folder.path()};
  fakes::FakeLog log;
  platform::LinuxSandbox granting{root, log};
};

TEST_F(PassedUploadFileTest, IsReadThroughTheDescriptor) {
  const UploadFile file = openPassed(write("a", "text"), O_RDONLY);
  EXPECT_TRUE(file.isRegular);
  EXPECT_EQ(file.contents(), "text");
}

TEST_F(PassedUploadFileTest, IsRegularOnlyForAFile) {
  ASSERT_EQ(::mkfifo((folder.path() / "pipe").c_str(), 0600), 0);
  EXPECT_FALSE(openPassed(folder.path() / "pipe", O_RDONLY | O_NONBLOCK).isRegular);
  EXPECT_FALSE(openPassed(folder.path(), O_RDONLY).isRegular);
  EXPECT_FALSE(openPassed("/dev/zero", O_RDONLY).isRegular);
}

TEST_F(PassedUploadFileTest, IsNotThereWithoutADescriptor) {
  EXPECT_FALSE(UploadFile::open(granting, "/not/here").isRegular);
}

}  // namespace
}  // namespace tallyd
