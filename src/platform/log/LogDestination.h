// Where the log goes and how much of it.
#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/Clock.h"
#include "platform/Log.h"

namespace tallyd::platform {

enum class LogDestination { Journal, Syslog, StandardError };

/// The destination called "journal", "syslog" or "stderr"; nothing for any other name.
[[nodiscard]] std::optional<LogDestination> logDestinationNamed(std::string_view name);

/// The journal when its socket exists, else syslog when /dev/log exists, else the standard error output.
///
/// @param exists  Whether there is something at a path.
[[nodiscard]] LogDestination defaultLogDestination(
    const std::function<bool(const std::filesystem::path&)>& exists);

/// The same for this system.
[[nodiscard]] LogDestination defaultLogDestination();

/// A level from its number, 0 to 7, or its name in syslog.conf(5), such as "err", "warning" or "debug", or in
/// full, such as "error" or "critical"; upper or lower case. Nothing for any other text.
[[nodiscard]] std::optional<LogLevel> logLevelNamed(std::string_view text);

/// A log that is not open yet, and that takes lines up to `highestLevel`. Borrows `clock`, which must outlive
/// it.
[[nodiscard]] std::unique_ptr<Log> makeLog(LogDestination destination, LogLevel highestLevel,
                                           const Clock& clock);

}  // namespace tallyd::platform
