#include "support/MessageLog.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <new>
#include <system_error>

#include "platform/AppendWhole.h"
#include "platform/FileDescriptor.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Settings.h"

namespace tallyd {

using platform::asl_log;
using platform::Date;
using platform::FileDescriptor;
using platform::LogLevel;
using platform::Value;

namespace {

constexpr std::string_view kDirectory = "/var/mobile/Library/Logs/CrashReporter/Retired";
constexpr std::string_view kFileNameStart = "tallyd";
constexpr std::string_view kFileNameEnd = "messageLog.diag";
constexpr std::string_view kPathKey = "logFilePath";
constexpr std::string_view kCreationDateKey = "logFileCreationDate";

bool isDirectory(const std::string& path) {
  std::error_code ignored;
  return std::filesystem::is_directory(path, ignored);
}

bool exists(const std::string& path) {
  std::error_code ignored;
  return std::filesystem::exists(path, ignored);
}

void createDirectories(const std::string& path) {
  std::error_code ignored;
  std::filesystem::create_directories(path, ignored);
}

/// When the file was made, or last changed where the file system does not keep that.
std::optional<Date> creationDate(const std::string& path) {
  struct statx facts {};
  if (statx(AT_FDCWD, path.c_str(), 0, STATX_BTIME | STATX_MTIME, &facts) != 0) return std::nullopt;
  const auto& time = (facts.stx_mask & STATX_BTIME) != 0 ? facts.stx_btime : facts.stx_mtime;
  return Date{static_cast<double>(time.tv_sec) + time.tv_nsec / 1e9};
}

std::string describe(const std::optional<std::string>& path) { return path.value_or("(null)"); }
std::string describe(const std::optional<Date>& date) { return date ? Value(*date).description() : "(null)"; }

FileDescriptor openForLine(const std::string& path) {
  return FileDescriptor(::open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
}

template <class Write>
void loseWithoutMemory(platform::Log& log, const Write& write) {
  try {
    write();
  } catch (const std::bad_alloc&) {
    asl_log(log, LogLevel::Critical, "No memory for a line of the tallyd log file");
  }
}

}  // namespace

bool isMessageLogFileName(std::string_view name) {
  if (std::count(name.begin(), name.end(), '_') != 2) return false;
  return name.substr(0, name.find('_')) == kFileNameStart && name.substr(name.rfind('_') + 1) == kFileNameEnd;
}

MessageLog::MessageLog(const platform::Platform& platform)
    : _platform(platform), _directory(platform.root.under(kDirectory).string()) {}

void MessageLog::writeMessageLog(std::string_view message) {
  loseWithoutMemory(_platform.log, [&] { writeLine(message); });
}

void MessageLog::writeFormatted(fmt::string_view format, fmt::format_args arguments) {
  loseWithoutMemory(_platform.log, [&] { writeLine(fmt::vformat(format, arguments)); });
}

void MessageLog::writeLine(std::string_view message) {
  const std::lock_guard lock(_mutex);
  _platform.process.logDirectoryChecked.get([this] {
    ensureLogDirectory();
    return std::monostate();
  });
  CurrentFile file = savedFile();
  if (!file.path || !file.created) file = findExistingFile(std::move(file));
  if (isExpired(file)) {
    retire(file);
    file = {};
  }
  // A date alone names no file; a path alone is written to as it is until a later search finds its date.
  if (!file.path) file = createFile();
  if (file.path) append(file, message);
  if (!file.isSaved) remember(file);
}

void MessageLog::ensureLogDirectory() {
  asl_log(_platform.log, LogLevel::Info, "Checking for tallyd log directory {}", _directory);
  if (isDirectory(_directory)) {
    asl_log(_platform.log, LogLevel::Info, "Found tallyd log directory {}", _directory);
    return;
  }
  asl_log(_platform.log, LogLevel::Info, "Creating tallyd log directory {}", _directory);
  createDirectories(_directory);
}

MessageLog::CurrentFile MessageLog::savedFile() const {
  const auto path = _platform.defaults.value(kPathKey);
  const auto created = _platform.defaults.value(kCreationDateKey);
  CurrentFile file;
  if (path && path->string()) file.path = std::string(*path->string());
  if (created) file.created = created->date();
  file.isSaved = path.has_value() == file.path.has_value() && created.has_value() == file.created.has_value();
  if (!file.path) return file;
  file.opened = openForLine(*file.path);
  if (file.opened || exists(*file.path)) return file;
  asl_log(_platform.log, LogLevel::Info, "Saved tallyd log file {} not found - invalidating file path",
          *file.path);
  return {};
}

MessageLog::CurrentFile MessageLog::findExistingFile(CurrentFile file) {
  asl_log(_platform.log, LogLevel::Info, "Searching for existing tallyd log file in {}", _directory);
  const auto name = firstListedFile();
  if (!name) return file;
  const std::string path = _directory + "/" + *name;
  file = {path, creationDate(path), {}, false};
  asl_log(_platform.log, LogLevel::Info, "Found existing tallyd log file {} ({})", *file.path,
          describe(file.created));
  return file;
}

std::optional<std::string> MessageLog::firstListedFile() {
  std::error_code error;
  std::filesystem::directory_iterator entry(_directory, error);
  for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
    std::string name = entry->path().filename().string();
    if (isMessageLogFileName(name)) return name;
  }
  if (error == std::errc::no_such_file_or_directory) {
    asl_log(_platform.log, LogLevel::Info, "Creating tallyd log directory at {}", _directory);
    createDirectories(_directory);
  } else if (error) {
    asl_log(_platform.log, LogLevel::Critical, "Error reading from log directory: {}", error.message());
  }
  return std::nullopt;
}

bool MessageLog::isExpired(const CurrentFile& file) const {
  if (!file.created) return false;
  const double age = platform::secondsSince1970(_platform.clock.now()) - file.created->secondsSince1970;
  return age > static_cast<double>(kMaximumAge.count());
}

void MessageLog::retire(const CurrentFile& file) {
  asl_log(_platform.log, LogLevel::Info, "Deleting expired tallyd log file {} ({})", describe(file.path),
          describe(file.created));
  std::error_code ignored;
  if (file.path) std::filesystem::remove(*file.path, ignored);
}

MessageLog::CurrentFile MessageLog::createFile() {
  const auto seconds = static_cast<std::int32_t>(_platform.clock.timeOfDay().tv_sec);
  const std::string path = fmt::format("{}/{}_{}_{}", _directory, kFileNameStart, seconds, kFileNameEnd);
  constexpr mode_t kMode = 0644;
  FileDescriptor(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, kMode)).reset();
  if (!exists(path)) {
    asl_log(_platform.log, LogLevel::Critical, "Failed to create new tallyd log file {}", path);
    return {};
  }
  const auto created = creationDate(path);
  asl_log(_platform.log, LogLevel::Info, "Created new tallyd log file {} ({})", path, describe(created));
  return {path, created};
}

void MessageLog::append(CurrentFile& file, std::string_view message) {
  const std::string& date = dateText();
  std::string line;
  line.reserve(date.size() + message.size() + std::string_view("() \n").size());
  line.append("(").append(date).append(") ").append(message).append("\n");
  if (!file.opened) file.opened = openForLine(*file.path);
  const std::error_code error = file.opened ? platform::appendWhole(file.opened.get(), line)
                                            : std::error_code(errno, std::generic_category());
  if (error) {
    asl_log(_platform.log, LogLevel::Critical, "Error writing to tallyd log file {}: {}", *file.path,
            error.message());
  }
  asl_log(_platform.log, LogLevel::Info, "Saved log message to {}", *file.path);
}

/// Of now; made once a second.
const std::string& MessageLog::dateText() {
  const Date now = platform::dateFromTimePoint(_platform.clock.now());
  const double second = std::floor(now.secondsSince1970);
  if (_dateText.empty() || second != _dateSecond) {
    _dateText = Value(now).description();
    _dateSecond = second;
  }
  return _dateText;
}

void MessageLog::remember(const CurrentFile& file) {
  _platform.defaults.setValue(kPathKey, file.path ? std::optional<Value>(*file.path) : std::nullopt);
  _platform.defaults.setValue(kCreationDateKey,
                              file.created ? std::optional<Value>(*file.created) : std::nullopt);
}

}  // namespace tallyd
