// The system log: levelled lines to one destination.
#pragma once

#include <fmt/format.h>

#include <atomic>
#include <string_view>

namespace tallyd::platform {

/// Severities, numbered as syslog's (RFC 5424, section 6.2.1).
enum class LogLevel : int {
  Critical = 2,  ///< Failures.
  Error = 3,
  Warning = 4,
  Info = 6,
  Debug = 7,  ///< Traces.
};

/// One log destination. Threading: any thread; a write may block as long as its destination does.
class Log {
 public:
  virtual ~Log() = default;

  /// Names the program in every later line; called once, before the first line.
  virtual void open(std::string_view identity, std::string_view facility) = 0;
  virtual void close() = 0;

  /// Hands one line to the destination. A line feed at its end is dropped, inner ones are kept.
  virtual void write(LogLevel level, std::string_view message) = 0;

  /// Whether a line of this level goes anywhere; one that does not need not be formatted.
  [[nodiscard]] bool takes(LogLevel level) const noexcept {
    return static_cast<int>(level) <= _highestLevel.load(std::memory_order_relaxed);
  }

 protected:
  explicit Log(LogLevel highestLevel) : _highestLevel(static_cast<int>(highestLevel)) {}

 private:
  std::atomic<int> _highestLevel;
};

/// Formats one line and writes it. A line for which there is no memory is lost.
void writeLogLine(Log& log, LogLevel level, fmt::string_view format, fmt::format_args arguments);

/// The same; costs a comparison when no destination takes the level.
template <class... Arguments>
void asl_log(Log& log, LogLevel level, fmt::format_string<Arguments...> format, Arguments&&... arguments) {
  if (!log.takes(level)) return;
  writeLogLine(log, level, format, fmt::make_format_args(arguments...));
}

}  // namespace tallyd::platform
