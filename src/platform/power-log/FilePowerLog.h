// The power log as a file of JSON lines.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <filesystem>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Clock.h"
#include "platform/FileDescriptor.h"
#include "platform/Log.h"
#include "platform/PowerLog.h"
#include "platform/Root.h"

namespace tallyd::platform {

/// Appends each event as one line (PowerLogLine.h) to "var/log/tallyd/power.jsonl" below the root, readable
/// by its owner and group. A file that a line would take beyond the limit becomes "power.jsonl.1", in place
/// of the one before it, and a new one is begun.
///
/// The process is the file's one writer. The file is opened for each line: when another program moves it
/// away, the next line begins a new one. A line that can't be written is lost as a whole; the first of a row
/// of such failures is logged, and each is thrown.
///
/// Threading: any thread; calls are serialised by an internal lock, and each blocks on the disk, never on a
/// pipe or device.
class FilePowerLog final : public PowerLog {
 public:
  /// Two files of this size hold weeks of events, and no device misses the space.
  static constexpr std::size_t kMaximumFileBytes = std::size_t{4} << 20;

  /// Borrows `clock` and `log`; both must outlive this object. Touches no file.
  FilePowerLog(const Root& root, const Clock& clock, Log& log,
               std::size_t maximumFileBytes = kMaximumFileBytes);

  void WBLogRegisteredEvent(std::int32_t number, std::string_view name, const Dictionary& record) override;

 private:
  struct OpenFile {
    FileDescriptor descriptor;
    off_t bytes = 0;
  };

  /// Throws std::system_error when the line can't be written.
  void append(std::string_view line) const;
  [[nodiscard]] OpenFile openFile() const;
  void retireFile() const;

  const std::filesystem::path _path;
  const Clock& _clock;
  Log& _log;
  const std::size_t _maximumFileBytes;
  std::mutex _mutex;
  bool _failing = false;  ///< Guarded by the lock: the last line was lost.
};

}  // namespace tallyd::platform
