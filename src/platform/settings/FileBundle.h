// A bundle as a folder on disk.
#pragma once

#include <filesystem>
#include <memory>

#include "platform/Log.h"
#include "platform/Settings.h"

namespace tallyd::platform {

class PropertyListFile;

/// The information dictionary is DIR/Info.plist, read afresh when it changed; the resource NAME of TYPE is
/// the file DIR/Resources/NAME.TYPE, read at each call. What is there but can't be read counts as missing and
/// is logged: the dictionary once for each change, a resource at each call.
class FileBundle : public Bundle {
 public:
  /// Borrows `log`. Touches no file.
  FileBundle(std::filesystem::path directory, Log& log);
  ~FileBundle() override;

  /// Blocks on the disk, as does the next.
  [[nodiscard]] std::optional<Value> infoValue(std::string_view key) const override;
  /// Up to kMaximumSettingsFileBytes. An empty `type` names the file NAME.
  [[nodiscard]] std::optional<Data> resource(std::string_view name, std::string_view type) const override;

 private:
  const std::filesystem::path _directory;
  Log& _log;
  const std::unique_ptr<PropertyListFile> _information;
};

}  // namespace tallyd::platform
