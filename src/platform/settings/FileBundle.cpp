#include "platform/settings/FileBundle.h"

#include <cerrno>

#include "platform/settings/FileReading.h"
#include "platform/settings/PropertyListFile.h"

namespace tallyd::platform {

FileBundle::FileBundle(std::filesystem::path directory, Log& log)
    : _directory(std::move(directory)),
      _log(log),
      _information(std::make_unique<PropertyListFile>(_directory / "Info.plist", log)) {}

FileBundle::~FileBundle() = default;

std::optional<Value> FileBundle::infoValue(std::string_view key) const { return _information->value(key); }

std::optional<Data> FileBundle::resource(std::string_view name, std::string_view type) const {
  std::string fileName(name);
  if (!type.empty()) fileName.append(".").append(type);
  if (name.empty() || !isPlainFileName(fileName)) return std::nullopt;
  const auto path = _directory / "Resources" / fileName;
  FileContents file = readFile(path);
  if (file.bytes) return Data(std::move(*file.bytes));
  if (file.errorNumber != ENOENT && file.errorNumber != ENOTDIR) logUnreadableFile(_log, path, file.error);
  return std::nullopt;
}

}  // namespace tallyd::platform
