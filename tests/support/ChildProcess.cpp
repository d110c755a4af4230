#include "support/ChildProcess.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>
#include <csignal>

#include <chrono>
#include <stdexcept>

namespace tallyd::test {

namespace {

constexpr std::chrono::seconds kPatience{20};
constexpr std::chrono::seconds kExitPatience{30};

struct PipeEnds {
  platform::FileDescriptor readEnd;
  platform::FileDescriptor writeEnd;
};

PipeEnds makePipe() {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  return {platform::FileDescriptor(ends[0]), platform::FileDescriptor(ends[1])};
}

}  // namespace

ChildProcess::ChildProcess(const std::string& program, const std::vector<std::string>& arguments) {
  PipeEnds output = makePipe();
  PipeEnds errors = makePipe();
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  ::posix_spawn_file_actions_adddup2(&actions, output.writeEnd.get(), STDOUT_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, errors.writeEnd.get(), STDERR_FILENO);

  std::vector<const char*> words{program.c_str()};
  for (const std::string& argument : arguments) words.push_back(argument.c_str());
  words.push_back(nullptr);
  const int error =
      ::posix_spawn(&_pid, program.c_str(), &actions, nullptr, const_cast<char**>(words.data()), environ);
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::runtime_error("can't start " + program);

  _pipes[0].readEnd = std::move(output.readEnd);
  _pipes[1].readEnd = std::move(errors.readEnd);
  for (Pipe& pipe : _pipes) startReader(pipe);
}

ChildProcess::~ChildProcess() {
  if (!_exitStatus) {
    sendSignal(SIGKILL);
    static_cast<void>(waitForExit());
  }
  for (Pipe& pipe : _pipes) pipe.reader.join();
}

void ChildProcess::startReader(Pipe& pipe) {
  pipe.reader = std::thread([this, &pipe] {
    std::array<char, 4096> buffer;
    ssize_t count = 0;
    do {
      count = ::read(pipe.readEnd.get(), buffer.data(), buffer.size());
      const std::lock_guard lock(_mutex);
      if (count > 0) pipe.text.append(buffer.data(), static_cast<std::size_t>(count));
      pipe.ended = count <= 0;
      _changed.notify_all();
    } while (count > 0);
  });
}

std::string ChildProcess::text(Stream stream) const {
  const std::lock_guard lock(_mutex);
  return pipe(stream).text;
}

bool ChildProcess::waitForText(Stream stream, const std::string& part) const {
  std::unique_lock lock(_mutex);
  const Pipe& watched = pipe(stream);
  const auto isThere = [&] { return watched.text.find(part) != std::string::npos; };
  _changed.wait_for(lock, kPatience, [&] { return isThere() || watched.ended; });
  return isThere();
}

void ChildProcess::sendSignal(int signal) const { ::kill(_pid, signal); }

std::optional<int> ChildProcess::waitForExit() {
  if (_exitStatus) return _exitStatus;
  {
    std::unique_lock lock(_mutex);
    const bool ended =
        _changed.wait_for(lock, kExitPatience, [this] { return _pipes[0].ended && _pipes[1].ended; });
    if (!ended) return std::nullopt;
  }
  int status = 0;
  ::waitpid(_pid, &status, 0);
  _exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  return _exitStatus;
}

}  // namespace tallyd::test
