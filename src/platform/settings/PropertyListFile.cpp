#include "platform/settings/PropertyListFile.h"

#include <cerrno>
#include <system_error>
#include <utility>

#include "platform/property-list/PropertyList.h"
#include "platform/settings/FileReading.h"

namespace tallyd::platform {

namespace {

bool meansMissing(int errorNumber) { return errorNumber == ENOENT || errorNumber == ENOTDIR; }

/// Whether the same file may be read the next time.
bool passesBy(int errorNumber) {
  return errorNumber == EMFILE || errorNumber == ENFILE || errorNumber == ENOMEM || errorNumber == EIO;
}

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
  _known.reset();
  _contents = Dictionary();
  if (current.errorNumber != 0) {
    _known = current;
    return meansMissing(current.errorNumber) ? std::string()
                                             : std::generic_category().message(current.errorNumber);
  }
  FileContents file = readFile(_path);
  if (passesBy(file.errorNumber)) {
    const bool isNew = std::exchange(_passingError, file.errorNumber) != file.errorNumber;
    return isNew ? std::move(file.error) : std::string();
  }
  _passingError = 0;
  if (!file.bytes) {
    _known = current;
    return meansMissing(file.errorNumber) ? std::string() : std::move(file.error);
  }
  DictionaryResult read = dictionaryWithData(*file.bytes);
  // The file may have been replaced since its status was asked for; what counts is the one that was read.
  _known = identity(file.status);
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
