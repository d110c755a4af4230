// A program under test, started and watched.
#pragma once

#include <sys/types.h>

#include <array>
#include <condition_variable>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// Runs a program with the test's environment and collects what it writes. Destroying it kills a program that
/// still runs.
///
/// Threading: one thread.
class ChildProcess {
 public:
  enum class Stream { Output, Errors };

  /// @param arguments  Without the program's name. Throws std::runtime_error when the program can't be
  /// started.
  ChildProcess(const std::string& program, const std::vector<std::string>& arguments);
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  [[nodiscard]] pid_t pid() const { return _pid; }
  /// Everything that was written so far.
  [[nodiscard]] std::string text(Stream stream) const;
  /// Waits until `part` was written; false when the stream ends, or 20 s pass, without it.
  [[nodiscard]] bool waitForText(Stream stream, const std::string& part) const;
  void sendSignal(int signal) const;
  /// Waits for the end of both streams and of the program: its exit status, or minus the signal that ended
  /// it; nothing after 30 s.
  [[nodiscard]] std::optional<int> waitForExit();

 private:
  struct Pipe {
    platform::FileDescriptor readEnd;
    std::string text;
    bool ended = false;
    std::thread reader;
  };

  void startReader(Pipe& pipe);
  [[nodiscard]] const Pipe& pipe(Stream stream) const { return _pipes[stream == Stream::Output ? 0 : 1]; }

  pid_t _pid = -1;
  std::optional<int> _exitStatus;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::array<Pipe, 2> _pipes;
};

}  // namespace tallyd::test
