#include "platform/log/StderrLog.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include <cstdlib>
#include <thread>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {
namespace {

using namespace std::chrono_literals;

class FixedClock final : public Clock {
 public:
  [[nodiscard]] TimePoint now() const override {
    return TimePoint(1'673'784'000s + 45s + 7ms);
  }  // 12:00:45.007 GMT
};

/// A pipe that a log writes to.
struct Pipe {
  explicit Pipe(int flags = 0) {
    int ends[2];
    EXPECT_EQ(::pipe2(ends, flags | O_CLOEXEC), 0);
    reader = FileDescriptor(ends[0]);
    writer = FileDescriptor(ends[1]);
  }

  /// What was written so far.
  std::string taken() const {
    int waiting = 0;
    EXPECT_EQ(::ioctl(reader.get(), FIONREAD, &waiting), 0);
    std::string bytes(static_cast<std::size_t>(waiting), '\0');
    EXPECT_EQ(::read(reader.get(), bytes.data(), bytes.size()), waiting);
    return bytes;
  }

  FileDescriptor reader;
  FileDescriptor writer;
};

class StderrLogTest : public testing::Test {
 protected:
  const FixedClock _clock{};
};

TEST_F(StderrLogTest, WritesLevelAndMessage) {
  const Pipe pipe;
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get());
  log.open("tallyd", "Daemon");
  asl_log(log, LogLevel::Info, "{} connections", 2);
  log.write(LogLevel::Critical, "ends with a line feed\n");
  log.write(LogLevel::Debug, "");
  EXPECT_EQ(pipe.taken(), "<6>2 connections\n<2>ends with a line feed\n<7>\n");
}

TEST_F(StderrLogTest, LeavesOutHigherLevels) {
  const Pipe pipe;
  StderrLog log(LogLevel::Error, _clock, pipe.writer.get());
  asl_log(log, LogLevel::Warning, "left out");
  asl_log(log, LogLevel::Error, "kept");
  EXPECT_EQ(pipe.taken(), "<3>kept\n");
}

TEST_F(StderrLogTest, EveryLineOfAMessageCarriesItsLevel) {
  const Pipe pipe;
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get());
  log.write(LogLevel::Warning, "one\ntwo\n\nfour\n");
  EXPECT_EQ(pipe.taken(), "<4>one\n<4>two\n<4>\n<4>four\n");
}

TEST_F(StderrLogTest, AMessageIsOneWrite) {
  Pipe packets(O_DIRECT);  // In packet mode every write is read on its own.
  StderrLog log(LogLevel::Debug, _clock, packets.writer.get());
  log.write(LogLevel::Info, "one\ntwo");
  log.write(LogLevel::Info, "three");
  char bytes[64];
  ssize_t length = ::read(packets.reader.get(), bytes, sizeof bytes);
  EXPECT_EQ(std::string(bytes, static_cast<std::size_t>(length)), "<6>one\n<6>two\n");
  length = ::read(packets.reader.get(), bytes, sizeof bytes);
  EXPECT_EQ(std::string(bytes, static_cast<std::size_t>(length)), "<6>three\n");
}

TEST_F(StderrLogTest, WaitsForRoomInANonBlockingOutput) {
  Pipe pipe(O_NONBLOCK);
  const std::string message(1'000'000, 'x');  // Far more than a pipe holds.
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get(), 60s);
  std::thread writing([&] {
    log.write(LogLevel::Info, message);
    pipe.writer.reset();
  });
  std::string read;
  while (true) {
    pollfd arrival{pipe.reader.get(), POLLIN, 0};
    ASSERT_EQ(::poll(&arrival, 1, 60'000), 1);
    char bytes[16384];
    const ssize_t length = ::read(pipe.reader.get(), bytes, sizeof bytes);
    if (length == 0) break;
    read.append(bytes, static_cast<std::size_t>(length));
  }
  writing.join();
  EXPECT_TRUE(read == "<6>" + message + "\n") << read.size();
}

TEST_F(StderrLogTest, GivesUpALineThatAFullOutputDoesNotTake) {
  const Pipe pipe(O_NONBLOCK);
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get(), 0ms);
  const auto room = static_cast<std::size_t>(::fcntl(pipe.writer.get(), F_GETPIPE_SZ));
  ASSERT_EQ(::write(pipe.writer.get(), std::string(room, '.').data(), room), static_cast<ssize_t>(room));
  log.write(LogLevel::Info, "lost");
  EXPECT_EQ(pipe.taken(), std::string(room, '.'));
  log.write(LogLevel::Info, "kept");
  EXPECT_EQ(pipe.taken(), "<6>kept\n");
}

TEST_F(StderrLogTest, StartsANewLineAfterOneThatWasCut) {
  const Pipe pipe(O_NONBLOCK);
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get(), 0ms);
  const auto room = static_cast<std::size_t>(::fcntl(pipe.writer.get(), F_GETPIPE_SZ));
  log.write(LogLevel::Info, std::string(2 * room, 'x'));
  EXPECT_EQ(pipe.taken(), "<6>" + std::string(room - 3, 'x'));
  log.write(LogLevel::Info, "next");
  log.write(LogLevel::Info, "last");
  EXPECT_EQ(pipe.taken(), "\n<6>next\n<6>last\n");
}

TEST_F(StderrLogTest, SurvivesAReaderThatWentAway) {
  Pipe pipe;
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get());
  log.open("tallyd", "Daemon");
  pipe.reader.reset();
  log.write(LogLevel::Info, "nobody reads this");
  log.write(LogLevel::Info, "nor this");
}

TEST_F(StderrLogTest, SurvivesAClosedOutput) {
  Pipe pipe;
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get());
  pipe.writer.reset();
  log.write(LogLevel::Info, "lost");
  EXPECT_EQ(pipe.taken(), "");
}

TEST_F(StderrLogTest, ConcurrentLinesStayWhole) {
  Pipe pipe;
  StderrLog log(LogLevel::Debug, _clock, pipe.writer.get());
  const std::string message(6000, 'x');  // Above PIPE_BUF, so that the kernel alone would mix them.
  std::vector<std::thread> threads;
  threads.reserve(4);
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 10; ++i) log.write(LogLevel::Info, message);
    });
  }
  const std::string line = "<6>" + message + "\n";
  std::string read(40 * line.size(), '\0');
  for (std::size_t at = 0; at < read.size();) {
    const ssize_t length = ::read(pipe.reader.get(), read.data() + at, read.size() - at);
    ASSERT_GT(length, 0);
    at += static_cast<std::size_t>(length);
  }
  for (auto& thread : threads) thread.join();
  for (std::size_t at = 0; at < read.size(); at += line.size())
    EXPECT_TRUE(read.compare(at, line.size(), line) == 0) << at;
}

/// A terminal that passes bytes through as they are.
class StderrLogOnATerminalTest : public StderrLogTest {
 protected:
  void SetUp() override {
    ::setenv("TZ", "UTC0", 1);
    ::tzset();
    _far = FileDescriptor(::posix_openpt(O_RDWR | O_NOCTTY));
    ASSERT_TRUE(_far);
    ASSERT_EQ(::grantpt(_far.get()), 0);
    ASSERT_EQ(::unlockpt(_far.get()), 0);
    _near = FileDescriptor(::open(::ptsname(_far.get()), O_RDWR | O_NOCTTY));
    ASSERT_TRUE(_near);
    termios settings{};
    ASSERT_EQ(::tcgetattr(_near.get(), &settings), 0);
    ::cfmakeraw(&settings);
    ASSERT_EQ(::tcsetattr(_near.get(), TCSANOW, &settings), 0);
  }

  std::string shown(LogLevel level, std::string_view message) {
    StderrLog log(LogLevel::Debug, _clock, _near.get());
    log.open("tallyd", "Daemon");
    log.write(level, message);
    pollfd arrival{_far.get(), POLLIN, 0};
    EXPECT_EQ(::poll(&arrival, 1, 10'000), 1);
    char bytes[512];
    const ssize_t length = ::read(_far.get(), bytes, sizeof bytes);
    return length > 0 ? std::string(bytes, static_cast<std::size_t>(length)) : "";
  }

  FileDescriptor _far;
  FileDescriptor _near;
};

TEST_F(StderrLogOnATerminalTest, ShowsTheTimeAndTheProgram) {
  EXPECT_EQ(shown(LogLevel::Info, "ready\n"), "12:00:45.007 tallyd: ready\x1b[0m\n");
}

TEST_F(StderrLogOnATerminalTest, ColoursByLevel) {
  EXPECT_EQ(shown(LogLevel::Critical, "x"), "\x1b[1;31m12:00:45.007 tallyd: x\x1b[0m\n");
  EXPECT_EQ(shown(LogLevel::Error, "x"), "\x1b[31m12:00:45.007 tallyd: x\x1b[0m\n");
  EXPECT_EQ(shown(LogLevel::Warning, "x"), "\x1b[33m12:00:45.007 tallyd: x\x1b[0m\n");
  EXPECT_EQ(shown(LogLevel::Debug, "x"), "\x1b[2m12:00:45.007 tallyd: x\x1b[0m\n");
}

TEST_F(StderrLogOnATerminalTest, KeepsMessagesFromSteeringTheTerminal) {
  EXPECT_EQ(shown(LogLevel::Info, "a\x1b[2J\tb\rc\x7f"), "12:00:45.007 tallyd: a?[2J\tb?c?\x1b[0m\n");
}

TEST_F(StderrLogOnATerminalTest, PrefixesEveryLine) {
  EXPECT_EQ(shown(LogLevel::Info, "a\nä"), "12:00:45.007 tallyd: a\x1b[0m\n12:00:45.007 tallyd: ä\x1b[0m\n");
}

}  // namespace
}  // namespace tallyd::platform
