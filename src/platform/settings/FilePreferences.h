// Preference suites as property-list files.
#pragma once

#include <map>
#include <memory>
#include <mutex>

#include "platform/Log.h"
#include "platform/Root.h"
#include "platform/Settings.h"

namespace tallyd::platform {

class PropertyListFile;

/// Suite NAME is the dictionary in etc/tally/preferences/NAME.plist below the root, of any property-list
/// form, as the file stands at each question. A file that can't be read counts as missing and is logged once
/// for each change of it.
///
/// Holds the contents of every suite that was asked for.
class FilePreferences : public Preferences {
 public:
  /// Borrows `log`. Touches no file.
  FilePreferences(const Root& root, Log& log);
  ~FilePreferences() override;

  /// Blocks on the disk. A suite name that is no plain file name has no values.
  [[nodiscard]] std::optional<Value> value(std::string_view suite, std::string_view key) const override;

 private:
  const PropertyListFile& file(std::string_view suite) const;

  const std::filesystem::path _folder;
  Log& _log;
  mutable std::mutex _mutex;
  mutable std::map<std::string, std::unique_ptr<PropertyListFile>, std::less<>>
      _files;  ///< Guarded by `_mutex`.
};

}  // namespace tallyd::platform
