// The daemon's command line.
#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "daemon/TallydAgent.h"
#include "platform/log/LogDestination.h"

namespace tallyd {

struct DaemonOptions {
  std::filesystem::path root = "/";
  platform::LogDestination logDestination = platform::LogDestination::StandardError;
  platform::LogLevel logLevel = platform::LogLevel::Debug;
  bool sandbox = true;
  std::optional<std::chrono::seconds> drain;  ///< How long SIGTERM lets go on what is under way.
  unsigned retryPosts = 0;                    ///< Attempts beyond the first.
  AgentOptions agent;
};

/// The options, or the status to exit with when the command line asked for help or is wrong, which has then
/// been said.
struct ParsedOptions {
  std::optional<DaemonOptions> options;
  int exitStatus = 0;
};

/// Reads the command line and the environment variables TALLY_ROOT and TALLY_LOG, which it overrides.
[[nodiscard]] ParsedOptions parseDaemonOptions(int argumentCount, const char* const* arguments);

}  // namespace tallyd
