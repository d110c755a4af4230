// Daemons that do not speak, do not read, or do not even accept: nobody waits longer than was asked for.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <atomic>
#include <cstring>
#include <system_error>

#include "fakes/TemporaryFolder.h"
#include "framework/TallyConnection.h"
#include "platform/FileDescriptor.h"

namespace tallyd {
namespace {

using platform::Data;
using platform::Dictionary;
using platform::FileDescriptor;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds kShort{200};
constexpr milliseconds kSlack{2'500};  ///< Of a busy machine, with sanitizers.

class Stopwatch {
 public:
  [[nodiscard]] milliseconds elapsed() const {
    return std::chrono::duration_cast<milliseconds>(steady_clock::now() - _start);
  }

 private:
  const steady_clock::time_point _start = steady_clock::now();
};

class TallyPatienceTest : public testing::Test {
 protected:
  TallyPatienceTest() {
    std::strncpy(_address.sun_path, _path.c_str(), sizeof _address.sun_path - 1);
    EXPECT_EQ(::bind(_listening.get(), reinterpret_cast<const sockaddr*>(&_address), sizeof _address), 0);
    EXPECT_EQ(::listen(_listening.get(), 0), 0);
  }

  /// Takes the client's connection and says yes to it; nothing is read any more.
  FileDescriptor accept() {
    FileDescriptor served(::accept4(_listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
    std::string seen;
    char byte = 0;
    while (!seen.ends_with("BEGIN\r\n") && ::read(served.get(), &byte, 1) == 1) seen += byte;
    constexpr std::string_view kAnswer = "DATA\r\nOK 0123456789abcdef0123456789abcdef\r\nAGREE_UNIX_FD\r\n";
    EXPECT_EQ(::write(served.get(), kAnswer.data(), kAnswer.size()), static_cast<ssize_t>(kAnswer.size()));
    return served;
  }

  TallyConnectionOptions lasting(std::size_t maximumCalls = 1'000) const {
    return {.socketPath = _path, .timeout = kShort, .closeTimeout = kShort, .maximumCalls = maximumCalls};
  }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "service";
  sockaddr_un _address{.sun_family = AF_UNIX, .sun_path = {}};
  FileDescriptor _listening{::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
};

TEST_F(TallyPatienceTest, AMutePeerHoldsNobodyLongerThanTheTimeoutAndTheEndNotAtAll) {
  const Stopwatch watch;
  {
    TallyConnection connection(_path, kShort);
    const auto reply = connection.fetchDisplayURLSync();
    EXPECT_EQ(reply.kind, TallyError::TimedOut);
    EXPECT_GE(watch.elapsed(), kShort);
  }
  EXPECT_LT(watch.elapsed(), kShort + kSlack);
}

TEST_F(TallyPatienceTest, ACallsOwnTimeoutCounts) {
  TallyConnection connection({.socketPath = _path});
  const Stopwatch watch;
  EXPECT_EQ(connection.fetchDisplayURLSync(kShort).kind, TallyError::TimedOut);
  EXPECT_EQ(connection.flushMessagesSync(milliseconds(0)).kind, TallyError::TimedOut);
  EXPECT_EQ(connection.flushMessagesSync(milliseconds(-5)).kind, TallyError::TimedOut);
  EXPECT_LT(watch.elapsed(), kShort + kSlack);
}

TEST_F(TallyPatienceTest, TheLongestTimeoutThereIsDoesNotOverflow) {
  TallyConnection connection({.socketPath = _path, .closeTimeout = milliseconds(0)});
  std::atomic<int> completed = 0;
  connection.fetchDisplayURL([&](const auto&) { ++completed; }, milliseconds::max());
  EXPECT_EQ(connection.fetchDisplayURLSync(milliseconds(50)).kind, TallyError::TimedOut);
  EXPECT_EQ(completed, 0);
}

TEST_F(TallyPatienceTest, AFullBacklogHoldsTheConstructorForTheTimeoutOnly) {
  std::vector<FileDescriptor> others;
  do {
    others.emplace_back(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  } while (::connect(others.back().get(), reinterpret_cast<const sockaddr*>(&_address), sizeof _address) ==
           0);
  ASSERT_EQ(errno, EAGAIN);
  const Stopwatch watch;
  try {
    const TallyConnection connection(_path, kShort);
    FAIL();
  } catch (const std::system_error& error) {
    EXPECT_EQ(error.code().value(), ETIMEDOUT);
    EXPECT_NE(std::string(error.what()).find(_path.string()), std::string::npos);
  }
  EXPECT_GE(watch.elapsed(), kShort - milliseconds(10));
  EXPECT_LT(watch.elapsed(), kShort + kSlack);

  TallyConnection lastingOne(lasting());  // Tries again and again, on its own thread.
  EXPECT_EQ(lastingOne.fetchDisplayURLSync().kind, TallyError::TimedOut);
  EXPECT_LT(watch.elapsed(), kShort * 2 + kSlack);
}

TEST_F(TallyPatienceTest, AsynchronousCallsReturnAtOnceWhileTheSocketIsFull) {
  constexpr int kCalls = 100;
  const Dictionary payload{{"data", Data(std::string(1 << 20, 'x'))}};
  std::atomic<int> completed = 0;
  std::atomic<int> failed = 0;
  {
    FileDescriptor served;  // Stays open to the very end.
    TallyConnection connection({.socketPath = _path, .closeTimeout = kShort});
    served = accept();
    const Stopwatch watch;
    for (int i = 0; i < kCalls; ++i) {
      EXPECT_TRUE(connection.sendMessage(1, 2, payload, [&](const auto& reply) {
        ++completed;
        if (reply.error) ++failed;
      }));
    }
    EXPECT_LT(watch.elapsed(), kSlack);
    EXPECT_EQ(completed, 0);
    EXPECT_EQ(connection.fetchDisplayURLSync(kShort).kind, TallyError::TimedOut);
    EXPECT_LT(watch.elapsed(), kShort + kSlack);
  }
  EXPECT_EQ(completed, kCalls);  // Once each, when the connection was destroyed.
  EXPECT_EQ(failed, kCalls);
}

TEST_F(TallyPatienceTest, BehindAFullSocketCallsWaitUpToTheBoundAndEachIsCompletedOnce) {
  constexpr std::size_t kBound = 50;
  const Dictionary payload{{"data", Data(std::string(1 << 20, 'x'))}};
  std::atomic<int> refused = 0;
  std::atomic<int> timedOut = 0;
  std::atomic<int> others = 0;
  {
    FileDescriptor served;  // Stays open to the very end.
    TallyConnection connection(lasting(kBound));
    served = accept();
    std::size_t taken = 0;
    for (std::size_t i = 0; i < kBound * 2; ++i) {
      taken += connection.sendMessage(1, 2, payload, [&](const auto& reply) {
        ++(reply.kind == TallyError::Refused    ? refused
           : reply.kind == TallyError::TimedOut ? timedOut
                                                : others);
      });
    }
    EXPECT_EQ(taken, kBound);
    // The deadlines pass and make room.
    while (!connection.sendMessage(1, 2, {}, {}, milliseconds(1))) {
      EXPECT_TRUE(connection.fetchDisplayURLSync(milliseconds(20)).error);
    }
  }
  EXPECT_EQ(refused, static_cast<int>(kBound));
  EXPECT_EQ(timedOut, static_cast<int>(kBound));
  EXPECT_EQ(others, 0);
}

TEST_F(TallyPatienceTest, ADaemonThatHangsHoldsTheEndForTheCloseTimeoutOnly) {
  std::atomic<int> completed = 0;
  const Stopwatch watch;
  {
    FileDescriptor served;  // Stays open to the very end.
    TallyConnection connection({.socketPath = _path, .closeTimeout = kShort});
    served = accept();
    connection.flushMessages([&](const auto&) { ++completed; });
  }
  EXPECT_LT(watch.elapsed(), kShort + kSlack);
  EXPECT_EQ(completed, 1);
}

}  // namespace
}  // namespace tallyd
