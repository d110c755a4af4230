// The daemon's diary: one line per report sent, in a file that is replaced once a day.
#pragma once

#include <fmt/format.h>

#include <chrono>
#include <filesystem>
#include <mutex>
#include <optional>
#include <string_view>

#include "platform/Clock.h"
#include "platform/FileDescriptor.h"

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// Appends time-stamped lines to the current message log file and retires the file when it is a day old.
///
/// The current file's path and creation date survive restarts in the standard user defaults; when they are
/// lost, the file is found again by its name. Every failure, also for lack of memory, is logged and costs at
/// most the one line.
///
/// Threading: any thread; calls are serialised by an internal lock, and each blocks on the disk.
class MessageLog {
 public:
  static constexpr std::chrono::seconds kMaximumAge{86'400};  ///< A file older than this is replaced.

  /// Borrows the platform. Touches no file.
  explicit MessageLog(const platform::Platform& platform);

  /// Appends "(DATE) MESSAGE\n".
  ///
  /// @param message  UTF-8, any length, without the line feed.
  void writeMessageLog(std::string_view message);

  template <class... Arguments>
  void writeMessageLog(fmt::format_string<Arguments...> format,
                       Arguments&&... arguments) requires(sizeof...(Arguments) > 0) {
    writeFormatted(format, fmt::make_format_args(arguments...));
  }

 private:
  /// The file that lines go to; path and date may each be missing.
  struct CurrentFile {
    std::optional<std::string> path;
    std::optional<platform::Date> created;
    platform::FileDescriptor opened{};  ///< Once it has been needed.
    bool isSaved = false;               ///< The defaults hold just this.
  };

  void writeFormatted(fmt::string_view format, fmt::format_args arguments);
  void writeLine(std::string_view message);
  void ensureLogDirectory();
  CurrentFile savedFile() const;
  CurrentFile findExistingFile(CurrentFile file);
  /// The first message log file in the directory's listing; creates a directory that is missing.
  std::optional<std::string> firstListedFile();
  bool isExpired(const CurrentFile& file) const;
  void retire(const CurrentFile& file);
  CurrentFile createFile();
  void append(CurrentFile& file, std::string_view message);
  [[nodiscard]] const std::string& dateText();
  void remember(const CurrentFile& file);

  const platform::Platform& _platform;
  const std::string _directory;
  std::mutex _mutex;
  double _dateSecond = 0;  ///< Of `_dateText`, since 1970.
  std::string _dateText;
};

/// Whether a directory entry is a message log file: "tallyd", anything without "_", and "messageLog.diag",
/// joined by "_".
[[nodiscard]] bool isMessageLogFileName(std::string_view name);

}  // namespace tallyd
