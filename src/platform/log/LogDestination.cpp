#include "platform/log/LogDestination.h"

#include <algorithm>
#include <array>
#include <string>
#include <system_error>
#include <utility>

#include "platform/log/JournalLog.h"
#include "platform/log/StderrLog.h"
#include "platform/log/SyslogLog.h"

namespace tallyd::platform {
namespace {

constexpr const char* kJournalSocket = "/run/systemd/journal/socket";
constexpr const char* kSyslogSocket = "/dev/log";

constexpr std::array<std::pair<std::string_view, int>, 14> kLevelNames{{
    {"emerg", 0},
    {"emergency", 0},
    {"panic", 0},
    {"alert", 1},
    {"crit", 2},
    {"critical", 2},
    {"err", 3},
    {"error", 3},
    {"warn", 4},
    {"warning", 4},
    {"notice", 5},
    {"info", 6},
    {"information", 6},
    {"debug", 7},
}};

char lowercased(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + ('a' - 'A')) : c; }

}  // namespace

std::optional<LogDestination> logDestinationNamed(std::string_view name) {
  if (name == "journal") return LogDestination::Journal;
  if (name == "syslog") return LogDestination::Syslog;
  if (name == "stderr") return LogDestination::StandardError;
  return std::nullopt;
}

LogDestination defaultLogDestination(const std::function<bool(const std::filesystem::path&)>& exists) {
  if (exists(kJournalSocket)) return LogDestination::Journal;
  if (exists(kSyslogSocket)) return LogDestination::Syslog;
  return LogDestination::StandardError;
}

LogDestination defaultLogDestination() {
  return defaultLogDestination([](const std::filesystem::path& path) {
    std::error_code unreachable;
    return std::filesystem::exists(path, unreachable);
  });
}

std::optional<LogLevel> logLevelNamed(std::string_view text) {
  if (text.size() == 1 && text[0] >= '0' && text[0] <= '7') return static_cast<LogLevel>(text[0] - '0');
  std::string name(text);
  std::transform(name.begin(), name.end(), name.begin(), lowercased);
  const auto* found = std::find_if(kLevelNames.begin(), kLevelNames.end(),
                                   [&](const auto& level) { return level.first == name; });
  if (found == kLevelNames.end()) return std::nullopt;
  return static_cast<LogLevel>(found->second);
}

std::unique_ptr<Log> makeLog(LogDestination destination, LogLevel highestLevel, const Clock& clock) {
  switch (destination) {
    case LogDestination::Journal:
      return std::make_unique<JournalLog>(highestLevel);
    case LogDestination::Syslog:
      return std::make_unique<SyslogLog>(highestLevel);
    case LogDestination::StandardError:
      break;
  }
  return std::make_unique<StderrLog>(highestLevel, clock);
}

}  // namespace tallyd::platform
