// What the tests of the sandbox share: a root of their own, children to confine, and a log that keeps its
// lines.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Log.h"
#include "platform/Root.h"

namespace tallyd::platform {

class KeptLog final : public Log {
 public:
  KeptLog() : Log(LogLevel::Debug) {}
  void open(std::string_view, std::string_view) override {}
  void close() override {}
  void write(LogLevel level, std::string_view message) override {
    lines += std::to_string(static_cast<int>(level)) + " " + std::string(message) + "\n";
  }

  std::string lines;
};

/// A folder that vanishes with its owner.
class TemporaryFolder {
 public:
  TemporaryFolder() {
    std::string pattern = (std::filesystem::temp_directory_path() / "tallyd-sandbox-XXXXXX").string();
    if (::mkdtemp(pattern.data())) _path = std::filesystem::canonical(pattern);
  }
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;
  ~TemporaryFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(_path, ignored);
  }
  [[nodiscard]] const std::filesystem::path& path() const { return _path; }

 private:
  std::filesystem::path _path;
};

inline void writeFile(const std::filesystem::path& path, std::string_view contents) {
  std::filesystem::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary) << contents;
}

/// What `body` returns in a child process, as confinement is for good; how the child died when it did not
/// return.
inline std::string inChild(const std::function<std::string()>& body) {
  int ends[2];
  if (::pipe(ends) != 0) return "no pipe";
  const pid_t child = ::fork();
  if (child == 0) {
    const std::string result = body();
    const bool told = ::write(ends[1], result.data(), result.size()) == static_cast<ssize_t>(result.size());
    ::_exit(told ? 0 : 1);  // Not exit(): checks at the end of the program need what the sandbox forbids.
  }
  ::close(ends[1]);
  std::string result;
  char bytes[4096];
  ssize_t length = 0;
  while ((length = ::read(ends[0], bytes, sizeof bytes)) > 0)
    result.append(bytes, static_cast<std::size_t>(length));
  ::close(ends[0]);
  int status = 0;
  ::waitpid(child, &status, 0);
  if (status != 0) result += "[ended with status " + std::to_string(status) + "]";
  return result;
}

/// "ok", or the name of the error that a call left.
inline std::string outcome(long result) {
  if (result >= 0) return "ok";
  const char* name = ::strerrorname_np(errno);
  return name ? name : "?";
}

/// The outcomes of calls that are made one after the other, as the elements of a braced list are.
inline std::string inTurn(std::initializer_list<std::string> outcomes) {
  std::string all;
  for (const auto& each : outcomes) all += (all.empty() ? "" : " ") + each;
  return all;
}

inline std::string outcomeOfOpening(const std::filesystem::path& path, int flags) {
  const FileDescriptor file(::open(path.c_str(), flags | O_CLOEXEC, 0644));
  return outcome(file.get());
}

}  // namespace tallyd::platform
