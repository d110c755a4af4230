// A property-list file that is read afresh when it changed.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <filesystem>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"
#include "platform/Value.h"

namespace tallyd::platform {

/// The dictionary in a file that others write.
///
/// Each question looks at the file's status only; the file is read when device, inode, size or one of the
/// times of change differ from when it was last read. A missing file has no entries. Neither has one that
/// can't be read, isn't a property list, or holds no dictionary; that costs one line in the log for each
/// change of the file. One that can't be read for want of descriptors or memory, or by an error of the disk,
/// is tried again at the next question.
///
/// Threading: any thread. The file is read under this object's lock, so that one change is read and
/// complained of once.
class PropertyListFile {
 public:
  /// Borrows `log`. Touches no file.
  PropertyListFile(std::filesystem::path path, Log& log) : _path(std::move(path)), _log(log) {}

  /// The file's dictionary as it stands now. Blocks on the disk.
  [[nodiscard]] Dictionary contents() const;
  /// The value under `key` as the file stands now.
  [[nodiscard]] std::optional<Value> value(std::string_view key) const;

 private:
  /// What tells one state of the file from another.
  struct Identity {
    int errorNumber = 0;
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    std::int64_t modifiedNs = 0;
    std::int64_t statusChangedNs = 0;  ///< Tells that a file has become readable.
    bool operator==(const Identity&) const = default;
  };
  static Identity identity(const struct ::stat& status);

  /// Reads the file; returns what is to be logged, or an empty text.
  std::string refresh(const Identity& current) const;

  const std::filesystem::path _path;
  Log& _log;
  mutable std::mutex _mutex;
  mutable std::optional<Identity> _known;  ///< Guarded by `_mutex`, as is the next.
  mutable Dictionary _contents;
  mutable int _passingError = 0;  ///< Of the last attempt to read, if it may pass by; complained of once.
};

/// The dictionary in the property list `bytes`, or why there is none.
struct DictionaryResult {
  std::optional<Dictionary> dictionary;
  std::string error;
};
[[nodiscard]] DictionaryResult dictionaryWithData(std::string_view bytes);

/// Logs that the settings file at `path` can't be read.
void logUnreadableFile(Log& log, const std::filesystem::path& path, std::string_view reason);

}  // namespace tallyd::platform
