// A child process that serves a socket: the daemon, or the bare server that is its floor.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>
#include <vector>

namespace tallyd::bench {

/// Started and ready when the constructor returns, ended and reaped when the destructor does.
class ServerProcess {
 public:
  /// Runs arguments[0]; what it writes is dropped. Waits until it tells that it is ready, as sd_notify(3) has
  /// it, through a socket in `folder`. Throws std::runtime_error when it doesn't.
  ServerProcess(std::vector<std::string> arguments, const std::filesystem::path& folder);
  ~ServerProcess();
  ServerProcess(const ServerProcess&) = delete;
  ServerProcess& operator=(const ServerProcess&) = delete;

  [[nodiscard]] pid_t id() const { return _id; }

 private:
  pid_t _id = -1;
};

/// Raises this process's limit of open descriptors, which children inherit, as far as the system lets it.
void raiseDescriptorLimit();

}  // namespace tallyd::bench
