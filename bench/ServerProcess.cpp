#include "ServerProcess.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <csignal>
#include <stdexcept>
#include <string_view>
#include <system_error>

#include "platform/FileDescriptor.h"

namespace tallyd::bench {

using platform::FileDescriptor;

namespace {

constexpr timeval kPatience{20, 0};

/// Ends a child that did not become what was wanted.
[[noreturn]] void giveUp(pid_t id, const std::string& why) {
  ::kill(id, SIGKILL);
  ::waitpid(id, nullptr, 0);
  throw std::runtime_error(why);
}

FileDescriptor readinessSocket(const std::filesystem::path& path) {
  std::filesystem::remove(path);
  FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (!socket || ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &kPatience, sizeof kPatience) != 0) {
    throw std::system_error(errno, std::generic_category(), path.string());
  }
  return socket;
}

pid_t spawn(std::vector<std::string> arguments, const std::string& readiness) {
  std::vector<char*> argumentPointers;
  for (std::string& argument : arguments) argumentPointers.push_back(argument.data());
  argumentPointers.push_back(nullptr);
  std::string notify = "NOTIFY_SOCKET=" + readiness;
  std::vector<char*> environment{notify.data()};
  for (char** entry = environ; *entry; ++entry) {
    if (!std::string_view(*entry).starts_with("NOTIFY_SOCKET=")) environment.push_back(*entry);
  }
  environment.push_back(nullptr);

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  pid_t id = -1;
  const int error =
      posix_spawn(&id, argumentPointers[0], &actions, nullptr, argumentPointers.data(), environment.data());
  posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::system_error(error, std::generic_category(), arguments[0]);
  return id;
}

}  // namespace

ServerProcess::ServerProcess(std::vector<std::string> arguments, const std::filesystem::path& folder) {
  const auto path = folder / "ready";
  const FileDescriptor socket = readinessSocket(path);
  const std::string program = arguments[0];
  _id = spawn(std::move(arguments), path.string());
  char message[256];
  const ssize_t length = ::recv(socket.get(), message, sizeof message, 0);
  if (length > 0 && std::string_view(message, static_cast<std::size_t>(length)).starts_with("READY=1"))
    return;
  giveUp(_id, program + " does not become ready");
}

ServerProcess::~ServerProcess() {
  ::kill(_id, SIGKILL);
  ::waitpid(_id, nullptr, 0);
}

void raiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

}  // namespace tallyd::bench
