// Disks that are full, read-only or gone under the message log and the power log: a line is lost as a whole,
// no event with it, and the books know.

#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <csignal>
#include <fstream>
#include <sstream>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

namespace fs = std::filesystem;

/// A small file system of its own below a folder, where this process may mount one; else the folder as it is,
/// with what it can do without.
class SmallDisk {
 public:
  static constexpr std::size_t kBytes = 256 * 1024;

  explicit SmallDisk(fs::path folder) : _folder(std::move(folder)) {
    fs::create_directories(_folder);
    const std::string options = "size=" + std::to_string(kBytes);
    _mounted = ::mount("tallyd-test", _folder.c_str(), "tmpfs", 0, options.c_str()) == 0;
  }
  ~SmallDisk() {
    if (_mounted) ::umount2(_folder.c_str(), MNT_DETACH);
  }
  SmallDisk(const SmallDisk&) = delete;
  SmallDisk& operator=(const SmallDisk&) = delete;

  [[nodiscard]] bool isMounted() const { return _mounted; }
  void fill() const {
    std::ofstream file(filler(), std::ios::binary | std::ios::app);
    const std::string piece(512, 'x');
    while (file.write(piece.data(), static_cast<std::streamsize>(piece.size())).flush()) {
    }
  }
  void makeRoom() const { fs::remove(filler()); }
  enum class Access : unsigned long { ReadWrite = 0, ReadOnly = MS_RDONLY };
  [[nodiscard]] bool remount(Access access) const {
    return ::mount(nullptr, _folder.c_str(), nullptr, MS_REMOUNT | static_cast<unsigned long>(access),
                   nullptr) == 0;
  }

 private:
  [[nodiscard]] fs::path filler() const { return _folder / "filler"; }

  const fs::path _folder;
  bool _mounted = false;
};

class DiskFaultTest : public FaultFixture {
 protected:
  static constexpr const char* kLogFolder = "/var/mobile/Library/Logs/CrashReporter/Retired";

  static bool complains(TestDaemon& daemon, const std::string& what) {
    return linesWith(daemon, "<2>", what, 1) > 0;
  }
  /// All events of a session are posted, whatever becomes of their lines.
  void expectPosted(TestDaemon& daemon, std::int64_t acceptedBefore) {
    constexpr int kMessages = 10;
    runSession(daemon, 7, kMessages);
    const Posts posts = settledPosts();
    EXPECT_EQ(posts.accepted, acceptedBefore + kMessages + kRecordsOfASession);
    EXPECT_EQ(posts.sent, posts.accepted);
    EXPECT_EQ(receivedEvents(collector).size(), static_cast<std::size_t>(posts.sent));
  }
  /// No line of the message log ends too early or begins within another one.
  void expectWholeLines() const {
    for (const std::string& line : root.messageLog()) {
      EXPECT_TRUE(line.starts_with("[splunk -> ")) << line;
      static_cast<void>(parsed(line.substr(std::min(line.size(), line.find("] ") + 2))));
    }
  }

  /// What the books say of the power log, which holds as many records, in whole lines.
  struct Records {
    std::int64_t sent = 0;
    std::int64_t lost = 0;
  };
  [[nodiscard]] Records settledRecords() const {
    TallyInspection inspection(inspectionSocket());
    const Dictionary row = rowOf(*statsWhen(inspection, nothingUnderWay).dictionary("total"), "power");
    const Records records{number(row, "sent"),
                          row.dictionary("dropped")->integer("not-recorded").value_or(0)};
    std::istringstream text(root.read("/var/log/tallyd/power.jsonl"));
    std::int64_t lines = 0;
    for (std::string line; std::getline(text, line); ++lines) static_cast<void>(parsed(line));
    EXPECT_EQ(lines, records.sent);
    return records;
  }
};

TEST_F(DiskFaultTest, GoesOnWhenTheDiskIsFullAndWritesAgainWhenItIsNot) {
  const SmallDisk disk(root.under("/var"));
  // Without a disk of its own the daemon may not let a file grow past this.
  TestDaemon::Options options;
  if (!disk.isMounted()) options.limits[RLIMIT_FSIZE] = 2000;
  TestDaemon daemon(root, options);
  expectPosted(daemon, 0);
  const std::size_t linesBefore = root.messageLog().size();
  if (disk.isMounted()) disk.fill();
  expectPosted(daemon, 12);
  EXPECT_TRUE(complains(daemon, "Error writing to tallyd log file")) << daemon.process().output();
  expectWholeLines();
  if (!disk.isMounted()) return;
  disk.makeRoom();
  expectPosted(daemon, 24);
  EXPECT_GT(root.messageLog().size(), linesBefore);
  expectWholeLines();
}

TEST_F(DiskFaultTest, OutlivesALimitOfFileSizes) {
  TestDaemon daemon(root, {.limits = {{RLIMIT_FSIZE, 2000}}});
  expectPosted(daemon, 0);
  expectPosted(daemon, 12);
  EXPECT_TRUE(complains(daemon, "Error writing to tallyd log file")) << daemon.process().output();
  expectWholeLines();
}

TEST_F(DiskFaultTest, BooksAsDroppedWhatAFullDiskKeepsOutOfThePowerLog) {
  storebags.serve("playhall", {{"power", Dictionary()}}, "max-age=600");
  const SmallDisk disk(root.under("/var"));
  TestDaemon::Options options;
  if (!disk.isMounted()) options.limits[RLIMIT_FSIZE] = 2000;
  TestDaemon daemon(root, options);
  runSession(daemon, 7, 5);
  EXPECT_EQ(settledRecords().sent, 5);
  if (disk.isMounted()) disk.fill();
  constexpr int kMessages = 60;  // More than what is left of a page takes.
  runSession(daemon, 7, kMessages);
  const Records whenFull = settledRecords();
  EXPECT_GT(whenFull.lost, 0);
  EXPECT_EQ(whenFull.sent + whenFull.lost, 5 + kMessages);
  EXPECT_EQ(linesWith(daemon, "<4>", "Can't write the power log", 1), 1U) << daemon.process().output();
  if (!disk.isMounted()) return;
  disk.makeRoom();
  runSession(daemon, 7, 5);
  const Records atTheEnd = settledRecords();
  EXPECT_EQ(atTheEnd.sent, whenFull.sent + 5);
  EXPECT_EQ(atTheEnd.lost, whenFull.lost);
}

TEST_F(DiskFaultTest, GoesOnWhenTheMessageLogsFolderIsReadOnly) {
  const SmallDisk disk(root.under("/var"));
  TestDaemon daemon(root);
  expectPosted(daemon, 0);
  const fs::path folder = root.under(kLogFolder);
  if (disk.isMounted()) {
    ASSERT_TRUE(disk.remount(SmallDisk::Access::ReadOnly));
  } else {
    for (const auto& file : fs::directory_iterator(folder)) fs::remove(file);
    ASSERT_EQ(::chmod(folder.c_str(), 0555), 0);
  }
  expectPosted(daemon, 12);
  EXPECT_TRUE(complains(daemon, "tallyd log file")) << daemon.process().output();
  if (disk.isMounted()) {
    ASSERT_TRUE(disk.remount(SmallDisk::Access::ReadWrite));
  } else {
    ASSERT_EQ(::chmod(folder.c_str(), 0755), 0);
  }
  const std::size_t lines = root.messageLog().size();
  expectPosted(daemon, 24);
  EXPECT_GT(root.messageLog().size(), lines);
}

TEST_F(DiskFaultTest, MakesTheMessageLogsFolderAnewWhenItWasRemoved) {
  TestDaemon daemon(root);
  expectPosted(daemon, 0);
  fs::remove_all(root.under("/var/mobile/Library"));
  expectPosted(daemon, 12);
  EXPECT_FALSE(root.messageLog().empty());
}

}  // namespace
}  // namespace tallyd::test
