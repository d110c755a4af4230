// The log on the standard error output, for service managers and for people.
#pragma once

#include <chrono>
#include <mutex>
#include <string>

#include "platform/Clock.h"
#include "platform/Log.h"

namespace tallyd::platform {

/// Writes each line as "<LEVEL>message" (sd-daemon(3)), with one write(2). On a terminal the line starts with
/// the local time and the program's name instead and is coloured by its level, and control characters are
/// shown as "?". Every line of a message with inner line feeds starts in the same way.
///
/// No failure of the output reaches the caller: a line that the output does not take is lost. An output that
/// is in non-blocking mode and full is waited for a while, then the rest of the line is dropped.
class StderrLog final : public Log {
 public:
  static constexpr std::chrono::milliseconds kPatience{
      1000};  ///< How long a full non-blocking output is waited for.

  /// Borrows `clock` and `descriptor`; both must outlive this object.
  StderrLog(LogLevel highestLevel, const Clock& clock, int descriptor = 2,
            std::chrono::milliseconds patience = kPatience);

  /// Has the process ignore SIGPIPE, unless it already handles it, so that a reader that went away ends
  /// nothing.
  void open(std::string_view identity, std::string_view facility) override;
  void close() override {}
  void write(LogLevel level, std::string_view message) override;

 private:
  void appendPrefix(fmt::memory_buffer& line, LogLevel level) const;
  void writeAll(std::string_view bytes);
  [[nodiscard]] bool waitForRoom() const;

  const Clock& _clock;
  const int _descriptor;
  const std::chrono::milliseconds _patience;
  const bool _terminal;
  std::string _identity;

  std::mutex _mutex;      ///< Keeps lines apart that the output takes in pieces.
  bool _cutLine = false;  ///< The last line lacks its end. Guarded by `_mutex`.
};

}  // namespace tallyd::platform
