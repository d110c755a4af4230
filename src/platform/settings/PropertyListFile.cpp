#include "platform/settings/PropertyListFile.h"

#include <cerrno>
#include <system_error>

#include "platform/property-list/PropertyList.h"
#include "platform/settings/FileReading.h"

namespace tallyd::platform {

namespace {

bool meansMissing(int errorNumber) { return errorNumber == ENOENT || errorNumber == ENOTDIR; }

std::int64_t nanoseconds(const timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

}  // namespace

PropertyListFile::Identity PropertyListFile::identity(const struct ::stat& status) {
  return {0,
          status.st_dev,
          status.st_ino,
          status.st_size,
          nanoseconds(status.st_mtim),
          nanoseconds(status.st_ctim)};
}

Dictionary PropertyListFile::contents() const {
  struct ::stat status {};
  Identity current;
  if (::stat(_path.c_str(), &status) == 0) {
    current = identity(status);
  } else {
    current.errorNumber = errno;
  }
  std::string complaint;
  Dictionary result;
  {
    const std::lock_guard lock(_mutex);
    if (_known != current) complaint = refresh(current);
    result = _contents;
  }
  if (!complaint.empty()) logUnreadableFile(_log, _path, complaint);
  return result;
}

std::optional<Value> PropertyListFile::value(std::string_view key) const {
  const Dictionary all = contents();
  const Value* found = all.find(key);
  return found ? std::optional(*found) : std::nullopt;
}

std::string PropertyListFile::refresh(const Identity& current) const {
  _known = current;
  _contents = Dictionary();
  if (meansMissing(current.errorNumber)) return {};
  if (current.errorNumber != 0) return std::generic_category().message(current.errorNumber);
  FileContents file = readFile(_path);
  if (!file.bytes) return meansMissing(file.errorNumber) ? std::string() : std::move(file.error);
  // The file may have been replaced since its status was asked for; what counts is the one that was read.
  _known = identity(file.status);
  DictionaryResult read = dictionaryWithData(*file.bytes);
  if (!read.dictionary) return std::move(read.error);
  _contents = std::move(*read.dictionary);
  return {};
}

DictionaryResult dictionaryWithData(std::string_view bytes) {
  PropertyListResult list = propertyListWithData(bytes);
  if (!list.value) return {std::nullopt, std::move(list.error)};
  if (const Dictionary* dictionary = list.value->dictionary()) return {*dictionary, {}};
  return {std::nullopt, "property list: no dictionary at the top"};
}

void logUnreadableFile(Log& log, const std::filesystem::path& path, std::string_view reason) {
  asl_log(log, LogLevel::Error, "Cannot read {}: {}", path.native(), reason);
}

}  // namespace tallyd::platform
