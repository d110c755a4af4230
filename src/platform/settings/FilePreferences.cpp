#include "platform/settings/FilePreferences.h"

#include "platform/settings/FileReading.h"
#include "platform/settings/PropertyListFile.h"

namespace tallyd::platform {

FilePreferences::FilePreferences(const Root& root, Log& log)
    : _folder(root.under("/etc/tally/preferences")), _log(log) {}

FilePreferences::~FilePreferences() = default;

std::optional<Value> FilePreferences::value(std::string_view suite, std::string_view key) const {
  if (!isPlainFileName(suite)) return std::nullopt;
  return file(suite).value(key);
}

const PropertyListFile& FilePreferences::file(std::string_view suite) const {
  const std::lock_guard lock(_mutex);
  auto found = _files.find(suite);
  if (found == _files.end()) {
    auto opened = std::make_unique<PropertyListFile>(_folder / (std::string(suite) + ".plist"), _log);
    found = _files.emplace(suite, std::move(opened)).first;
  }
  return *found->second;
}

}  // namespace tallyd::platform
