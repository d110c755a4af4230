// The daemon's standard user defaults in one property-list file.
#pragma once

#include <filesystem>
#include <mutex>

#include "platform/Log.h"
#include "platform/Root.h"
#include "platform/Settings.h"

namespace tallyd::platform {

/// Keeps the defaults in memory and in var/lib/tallyd/com.quillon.tallyd.plist below the root. The file is
/// read once, at the first use; every change replaces it atomically by a binary list, which unlike XML keeps
/// values to the letter.
///
/// A file that can't be read is logged and counts as empty; the next change replaces it. A change that can't
/// be stored is logged and stays in memory, and the next change tries to store everything again.
///
/// Threading: any thread. Changes are stored one after the other; readers wait for none of them, save for the
/// first use.
class FileUserDefaults : public UserDefaults {
 public:
  /// Borrows `log`. Touches no file.
  FileUserDefaults(const Root& root, Log& log);

  [[nodiscard]] std::optional<Value> value(std::string_view key) const override;
  /// Blocks until the change is on the disk.
  void setValue(std::string_view key, std::optional<Value> value) override;

 private:
  void loadOnce() const;
  /// Makes the change in memory; what is to be stored, or nothing when nothing changed.
  std::optional<Dictionary> changed(std::string_view key, std::optional<Value> value);
  void store(const Dictionary& values);

  const std::filesystem::path _path;
  Log& _log;
  mutable std::once_flag _loaded;
  std::mutex _storing;  ///< Held from a change to its being stored, so that files follow each other in order.
  mutable std::mutex _mutex;
  mutable Dictionary _values;  ///< Guarded by `_mutex`.
};

}  // namespace tallyd::platform
