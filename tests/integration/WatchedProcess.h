// A program under test: started, read line by line, signalled, waited for.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// How a program ended.
struct ExitStatus {
  std::optional<int> code;    ///< When it exited.
  std::optional<int> signal;  ///< When a signal ended it.
};

/// Gathers what the program writes to its standard output and error. Killed with this object when it still
/// runs.
///
/// Threading: the test's thread; a thread of its own reads.
class WatchedProcess {
 public:
  static constexpr std::chrono::seconds kPatience{30};  ///< How long a test waits for what must come.

  struct Options {
    std::vector<std::string> arguments;                ///< The program's path first.
    std::map<std::string, std::string> environment{};  ///< Beside the test's own.
    std::string input{};
    std::optional<int> descriptorLimit{};  ///< RLIMIT_NOFILE.
    std::map<int, std::size_t> limits{};  ///< Other resource limits (setrlimit(2)): RLIMIT_… and its value.
    int passedSocket = -1;                ///< Becomes descriptor 3, as a service manager passes it.
    std::optional<mode_t> umask{};        ///< The test's own otherwise.
  };

  explicit WatchedProcess(const Options& options);
  ~WatchedProcess();
  WatchedProcess(const WatchedProcess&) = delete;
  WatchedProcess& operator=(const WatchedProcess&) = delete;

  [[nodiscard]] pid_t pid() const { return _pid; }
  void signal(int number) const;
  /// Waits for the end; fails the test and kills the program when it does not come.
  ExitStatus wait();

  [[nodiscard]] std::vector<std::string> lines() const;
  [[nodiscard]] std::string output() const;
  [[nodiscard]] std::size_t count(const std::string& line) const;
  /// As count(), once it is `awaited` or nothing more comes: what a program has written is read a little
  /// later.
  [[nodiscard]] std::size_t countOnce(const std::string& line, std::size_t awaited) const;
  /// Waits until a line equals `line`, or starts with it; false when none comes.
  [[nodiscard]] bool waitForLine(const std::string& line) const;
  [[nodiscard]] bool waitForLineStartingWith(const std::string& start) const;
  [[nodiscard]] bool waitForLineCount(const std::string& line, std::size_t count) const;

 private:
  using Lines = std::vector<std::string>;
  void readLines(platform::FileDescriptor output);
  bool waitUntil(const std::function<bool(const Lines&)>& condition) const;

  pid_t _pid = -1;
  std::optional<ExitStatus> _status;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  Lines _lines;
  bool _ended = false;
  std::thread _reader;
};

}  // namespace tallyd::test
