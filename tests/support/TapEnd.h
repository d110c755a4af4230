// The reading end of what the daemon's tap writes to.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>

#include <optional>
#include <string>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// Reads line by line; what never comes fails the test.
class TapEnd {
 public:
  enum class Kind { Pipe, Socket };

  explicit TapEnd(Kind kind = Kind::Pipe) {
    int ends[2];
    const int result =
        kind == Kind::Pipe ? ::pipe2(ends, O_CLOEXEC) : ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends);
    EXPECT_EQ(result, 0);
    _reading = platform::FileDescriptor(ends[0]);
    writing = platform::FileDescriptor(ends[1]);
  }

  /// The next line without its line feed; nothing when none comes.
  std::optional<std::string> next() {
    while (_text.find('\n') == std::string::npos) {
      if (!readSome()) return std::nullopt;
    }
    const auto end = _text.find('\n');
    std::string line = _text.substr(0, end);
    _text.erase(0, end + 1);
    return line;
  }
  /// Waits for the other end to go; false when something comes instead.
  bool ended() { return _text.empty() && !readSome(); }
  void close() { _reading.reset(); }

  platform::FileDescriptor writing;

 private:
  bool readSome() {
    constexpr int kPatienceMs = 30'000;
    pollfd ready{.fd = _reading.get(), .events = POLLIN, .revents = 0};
    EXPECT_GT(::poll(&ready, 1, kPatienceMs), 0) << "nothing comes";
    char bytes[65'536];
    const ssize_t length = ::read(_reading.get(), bytes, sizeof bytes);
    if (length <= 0) return false;
    _text.append(bytes, static_cast<std::size_t>(length));
    return true;
  }

  platform::FileDescriptor _reading;
  std::string _text;
};

}  // namespace tallyd::test
