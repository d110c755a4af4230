// A child process that serves a socket: the daemon, or the bare server that is its floor.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

namespace tallyd::bench {

/// Started and ready when the constructor returns, ended and reaped when the destructor does.
class ServerProcess {
 public:
  /// Runs arguments[0], in the country that bench/Storebags.h lists. Waits until it tells that it is ready,
  /// as sd_notify(3) has it, through a socket in `folder`. Throws std::runtime_error when it doesn't.
  ///
  /// @param output  The file that takes what it writes, at its end.
  ServerProcess(std::vector<std::string> arguments, const std::filesystem::path& folder,
                const std::string& output = "/dev/null");
  ~ServerProcess();
  ServerProcess(const ServerProcess&) = delete;
  ServerProcess& operator=(const ServerProcess&) = delete;

  [[nodiscard]] pid_t id() const { return _id; }

 private:
  pid_t _id = -1;
};

/// The path of a program that lies where this one does.
[[nodiscard]] std::string programBeside(const std::string& name);

/// Raises this process's limit of open descriptors, which children inherit, as far as the system lets it.
void raiseDescriptorLimit();
/// Why this process and a child can't have so many connections at a time; empty when they can.
[[nodiscard]] std::string whyTooMany(std::size_t connections);

}  // namespace tallyd::bench
