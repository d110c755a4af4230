// The real daemon on a root of its own.
#pragma once

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "Report.h"
#include "ServerProcess.h"
#include "fakes/TemporaryFolder.h"

namespace tallyd::bench {

/// In the collector's place where no session is started, so that nothing is fetched or posted.
inline constexpr const char* kNowhere = "http://127.0.0.1:9";

enum class Logging {
  Warnings,   ///< Lines above warnings are left out, the others are thrown away.
  Everything  ///< Every line goes to a file.
};

/// The files that a daemon finds: sandbox profile, framework, device properties, preferences.
class DaemonRoot {
 public:
  /// @param collectorURL  where the daemon gets its storebags and posts its events to.
  DaemonRoot(const Settings& settings, const std::string& collectorURL);

  [[nodiscard]] const std::filesystem::path& path() const { return _folder.path(); }
  [[nodiscard]] std::filesystem::path socket() const;
  /// Of the daemon that runs here, its program first.
  [[nodiscard]] std::vector<std::string> arguments(const Settings& settings, Logging logging) const;

 private:
  fakes::TemporaryFolder _folder;
};

/// Runs while the object lives.
class Daemon {
 public:
  Daemon(const Settings& settings, const std::string& collectorURL, Logging logging = Logging::Warnings);

  [[nodiscard]] std::filesystem::path socket() const { return _root.socket(); }
  [[nodiscard]] pid_t id() const { return _process->id(); }
  /// Lines of the log so far. Only with Logging::Everything.
  [[nodiscard]] std::size_t logLines() const;
  /// Lines of the message log so far.
  [[nodiscard]] std::size_t messageLogLines() const;

 private:
  [[nodiscard]] std::filesystem::path logFile() const { return _root.path() / "log"; }

  DaemonRoot _root;
  std::unique_ptr<ServerProcess> _process;
};

}  // namespace tallyd::bench
