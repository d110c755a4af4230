#include "platform/settings/FileUserDefaults.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "platform/FileDescriptor.h"
#include "platform/property-list/PropertyList.h"
#include "platform/settings/FileReading.h"
#include "platform/settings/PropertyListFile.h"

namespace tallyd::platform {

namespace {

bool writeAll(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(descriptor, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

/// Replaces the file at `path` in one step; 0, or the errno of what failed.
int replaceFile(const std::filesystem::path& path, std::string_view bytes) {
  std::error_code error;
  std::filesystem::create_directories(path.parent_path(), error);
  if (error) return error.value();
  std::string temporary = path.native() + ".XXXXXX";
  FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
  if (!file) return errno;
  if (!writeAll(file.get(), bytes) || ::fsync(file.get()) != 0 ||
      ::rename(temporary.c_str(), path.c_str()) != 0) {
    const int failure = errno;
    ::unlink(temporary.c_str());
    return failure;
  }
  // Without this the rename may be lost with the power; the file is whole either way.
  const FileDescriptor folder(::open(path.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (folder) ::fsync(folder.get());
  return 0;
}

}  // namespace

FileUserDefaults::FileUserDefaults(const Root& root, Log& log)
    : _path(root.under("/var/lib/tallyd/com.quillon.tallyd.plist")), _log(log) {}

void FileUserDefaults::loadOnce() const {
  std::call_once(_loaded, [this] {
    const FileContents file = readFile(_path);
    if (!file.bytes) {
      if (file.errorNumber != ENOENT) logUnreadableFile(_log, _path, file.error);
      return;
    }
    DictionaryResult read = dictionaryWithData(*file.bytes);
    if (!read.dictionary) return logUnreadableFile(_log, _path, read.error);
    const std::lock_guard lock(_mutex);
    _values = std::move(*read.dictionary);
  });
}

std::optional<Value> FileUserDefaults::value(std::string_view key) const {
  loadOnce();
  const std::lock_guard lock(_mutex);
  const Value* found = _values.find(key);
  return found ? std::optional(*found) : std::nullopt;
}

void FileUserDefaults::setValue(std::string_view key, std::optional<Value> value) {
  loadOnce();
  const std::lock_guard storing(_storing);
  if (const auto values = changed(key, std::move(value))) store(*values);
}

std::optional<Dictionary> FileUserDefaults::changed(std::string_view key, std::optional<Value> value) {
  const std::lock_guard lock(_mutex);
  const Value* current = _values.find(key);
  const bool isSame = value ? current && *current == *value : !current;
  if (isSame) return std::nullopt;
  if (value) {
    _values.set(key, std::move(*value));
  } else {
    _values.remove(key);
  }
  return _values;
}

void FileUserDefaults::store(const Dictionary& values) {
  const auto bytes = dataWithPropertyList(Value(values), PropertyListFormat::Binary);
  const auto complain = [this](std::string_view reason) {
    asl_log(_log, LogLevel::Error, "Cannot write {}: {}", _path.native(), reason);
  };
  if (!bytes) return complain("a value that no property list can hold");
  if (const int failure = replaceFile(_path, *bytes)) complain(std::generic_category().message(failure));
}

}  // namespace tallyd::platform
