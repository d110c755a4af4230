// The real daemon on a root of its own.
#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "Report.h"
#include "ServerProcess.h"
#include "fakes/TemporaryFolder.h"

namespace tallyd::bench {

/// The body of a storebag server's answer: a signed bag with one HTTPS post backend that has no filters.
[[nodiscard]] std::string signedStorebag();

/// Runs while the object lives. Its log lines above warnings are left out, the others are thrown away.
class Daemon {
 public:
  /// @param collectorURL  where it gets its storebags and posts its events to.
  Daemon(const Settings& settings, const std::string& collectorURL);

  [[nodiscard]] std::filesystem::path socket() const;
  [[nodiscard]] pid_t id() const { return _process->id(); }

 private:
  fakes::TemporaryFolder _folder;
  std::unique_ptr<ServerProcess> _process;
};

}  // namespace tallyd::bench
