#include "ServerProcess.h"

#include <fcntl.h>
#include <fmt/format.h>
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
constexpr std::string_view kReadiness = "NOTIFY_SOCKET=";
constexpr std::string_view kLocale = "LC_ALL=";
constexpr const char* kLocaleOfServers = "en_US.UTF-8";

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

/// As exec(3) takes them.
std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

std::vector<std::string> environmentOf(const std::string& readiness) {
  std::vector<std::string> environment{std::string(kReadiness) + readiness,
                                       std::string(kLocale) + kLocaleOfServers};
  for (char** entry = environ; *entry; ++entry) {
    const std::string_view text = *entry;
    if (!text.starts_with(kReadiness) && !text.starts_with(kLocale)) environment.emplace_back(text);
  }
  return environment;
}

pid_t spawn(std::vector<std::string> arguments, const std::string& readiness, const std::string& output) {
  constexpr int kHow = O_WRONLY | O_CREAT | O_APPEND;
  constexpr mode_t kMode = 0600;
  std::vector<std::string> environment = environmentOf(readiness);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output.c_str(), kHow, kMode);
  posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
  pid_t id = -1;
  const int error = posix_spawn(&id, arguments[0].c_str(), &actions, nullptr, pointersTo(arguments).data(),
                                pointersTo(environment).data());
  posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::system_error(error, std::generic_category(), arguments[0]);
  return id;
}

}  // namespace

ServerProcess::ServerProcess(std::vector<std::string> arguments, const std::filesystem::path& folder,
                             const std::string& output) {
  const auto path = folder / "ready";
  const FileDescriptor socket = readinessSocket(path);
  const std::string program = arguments[0];
  _id = spawn(std::move(arguments), path.string(), output);
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

std::string programBeside(const std::string& name) {
  return (std::filesystem::read_symlink("/proc/self/exe").parent_path() / name).string();
}

void raiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

std::string whyTooMany(std::size_t connections) {
  constexpr std::size_t kForOtherThings = 100;
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return "the limit of open descriptors can't be read";
  const std::size_t needed = connections + kForOtherThings;
  if (limit.rlim_cur >= needed) return "";
  return fmt::format("{} open descriptors are needed and {} allowed (ulimit -Hn)", needed, limit.rlim_cur);
}

}  // namespace tallyd::bench
