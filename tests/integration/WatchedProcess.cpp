#include "integration/WatchedProcess.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <algorithm>
#include <csignal>
#include <system_error>

namespace tallyd::test {

using platform::FileDescriptor;

namespace {

struct Pipe {
  FileDescriptor read;
  FileDescriptor write;
};

Pipe makePipe() {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) throw std::system_error(errno, std::generic_category(), "pipe");
  return {FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& extra) {
  std::vector<std::string> merged;
  for (char** entry = environ; *entry; ++entry) {
    const std::string text = *entry;
    if (!extra.contains(text.substr(0, text.find('=')))) merged.push_back(text);
  }
  for (const auto& [name, value] : extra) merged.push_back(name + "=" + value);
  return merged;
}

/// Between fork and exec: system calls only.
[[noreturn]] void becomeProgram(const WatchedProcess::Options& options, int input, int output,
                                char* const* arguments, char** environment, char* listenPIDEntry) {
  dup2(input, STDIN_FILENO);
  dup2(output, STDOUT_FILENO);
  dup2(output, STDERR_FILENO);
  constexpr int kFirstPassedDescriptor = 3;  // sd_listen_fds(3): SD_LISTEN_FDS_START
  if (options.passedSocket >= 0) {
    if (options.passedSocket == kFirstPassedDescriptor) {
      fcntl(kFirstPassedDescriptor, F_SETFD, 0);
    } else {
      dup2(options.passedSocket, kFirstPassedDescriptor);
    }
    if (listenPIDEntry) {
      char digits[16];
      int length = 0;
      for (pid_t rest = getpid(); rest > 0; rest /= 10) digits[length++] = static_cast<char>('0' + rest % 10);
      while (length > 0) *listenPIDEntry++ = digits[--length];
      *listenPIDEntry = '\0';
    }
  }
  if (options.descriptorLimit) {
    const rlimit limit{static_cast<rlim_t>(*options.descriptorLimit),
                       static_cast<rlim_t>(*options.descriptorLimit)};
    setrlimit(RLIMIT_NOFILE, &limit);
  }
  for (const auto& [resource, value] : options.limits) {
    const rlimit limit{value, value};
    setrlimit(static_cast<__rlimit_resource>(resource), &limit);
  }
  if (options.umask) ::umask(*options.umask);
  execve(arguments[0], arguments, environment);
  _exit(127);
}

}  // namespace

WatchedProcess::WatchedProcess(const Options& options) {
  Pipe input = makePipe();
  Pipe output = makePipe();
  std::vector<std::string> arguments = options.arguments;
  std::vector<std::string> environment = mergedEnvironment(options.environment);
  char* listenPIDEntry = nullptr;
  if (options.passedSocket >= 0) {
    environment.emplace_back("LISTEN_FDS=1");
    environment.push_back("LISTEN_PID=" + std::string(16, '\0'));
  }
  const std::vector<char*> argumentPointers = pointersTo(arguments);
  std::vector<char*> environmentPointers = pointersTo(environment);
  if (options.passedSocket >= 0)
    listenPIDEntry = environment.back().data() + std::string("LISTEN_PID=").size();
  _pid = fork();
  if (_pid < 0) throw std::system_error(errno, std::generic_category(), "fork");
  if (_pid == 0) {
    becomeProgram(options, input.read.get(), output.write.get(), argumentPointers.data(),
                  environmentPointers.data(), listenPIDEntry);
  }
  output.write.reset();
  input.read.reset();
  std::signal(SIGPIPE, SIG_IGN);
  if (!options.input.empty()) {
    EXPECT_EQ(::write(input.write.get(), options.input.data(), options.input.size()),
              static_cast<ssize_t>(options.input.size()));
  }
  _reader = std::thread([this, end = std::move(output.read)]() mutable { readLines(std::move(end)); });
}

WatchedProcess::~WatchedProcess() {
  if (!_status) {
    ::kill(_pid, SIGKILL);
    ::waitpid(_pid, nullptr, 0);
  }
  _reader.join();
  if (!testing::Test::HasFailure()) return;
  for (const auto& line : _lines) std::fprintf(stderr, "  [%d] %s\n", static_cast<int>(_pid), line.c_str());
}

void WatchedProcess::signal(int number) const { ::kill(_pid, number); }

ExitStatus WatchedProcess::wait() {
  if (_status) return *_status;
  // The output ends with the program, which makes a deadline possible without polling.
  std::unique_lock lock(_mutex);
  if (!_changed.wait_for(lock, kPatience, [this] { return _ended; })) {
    ADD_FAILURE() << "process " << _pid << " did not end";
    ::kill(_pid, SIGKILL);
  }
  lock.unlock();
  int status = 0;
  ::waitpid(_pid, &status, 0);
  _status.emplace();
  if (WIFEXITED(status)) _status->code = WEXITSTATUS(status);
  if (WIFSIGNALED(status)) _status->signal = WTERMSIG(status);
  return *_status;
}

std::vector<std::string> WatchedProcess::lines() const {
  const std::lock_guard lock(_mutex);
  return _lines;
}

std::string WatchedProcess::output() const {
  std::string text;
  for (const auto& line : lines()) text += line + "\n";
  return text;
}

std::size_t WatchedProcess::count(const std::string& line) const {
  const auto all = lines();
  return static_cast<std::size_t>(std::count(all.begin(), all.end(), line));
}

std::size_t WatchedProcess::countOnce(const std::string& line, std::size_t awaited) const {
  (void)waitForLineCount(line, awaited);
  return count(line);
}

bool WatchedProcess::waitForLine(const std::string& line) const { return waitForLineCount(line, 1); }

bool WatchedProcess::waitForLineCount(const std::string& line, std::size_t count) const {
  return waitUntil([&](const Lines& all) {
    return static_cast<std::size_t>(std::count(all.begin(), all.end(), line)) >= count;
  });
}

bool WatchedProcess::waitForLineStartingWith(const std::string& start) const {
  return waitUntil([&](const Lines& all) {
    return std::any_of(all.begin(), all.end(),
                       [&](const std::string& line) { return line.starts_with(start); });
  });
}

bool WatchedProcess::waitUntil(const std::function<bool(const Lines&)>& condition) const {
  std::unique_lock lock(_mutex);
  _changed.wait_for(lock, kPatience, [&] { return _ended || condition(_lines); });
  return condition(_lines);
}

void WatchedProcess::readLines(FileDescriptor output) {
  std::string pending;
  char buffer[4096];
  ssize_t got = 0;
  while ((got = ::read(output.get(), buffer, sizeof buffer)) > 0) {
    pending.append(buffer, static_cast<std::size_t>(got));
    const std::lock_guard lock(_mutex);
    for (auto end = pending.find('\n'); end != std::string::npos; end = pending.find('\n')) {
      _lines.push_back(pending.substr(0, end));
      pending.erase(0, end + 1);
    }
    _changed.notify_all();
  }
  const std::lock_guard lock(_mutex);
  if (!pending.empty()) _lines.push_back(pending);
  _ended = true;
  _changed.notify_all();
}

}  // namespace tallyd::test
