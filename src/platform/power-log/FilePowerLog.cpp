#include "platform/power-log/FilePowerLog.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <system_error>

#include "platform/AppendWhole.h"
#include "platform/power-log/PowerLogLine.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kPath = "/var/log/tallyd/power.jsonl";
constexpr mode_t kMode = 0640;

[[noreturn]] void fail(const char* what) { throw std::system_error(errno, std::generic_category(), what); }

}  // namespace

FilePowerLog::FilePowerLog(const Root& root, const Clock& clock, Log& log, std::size_t maximumFileBytes)
    : _path(root.under(kPath)), _clock(clock), _log(log), _maximumFileBytes(maximumFileBytes) {}

void FilePowerLog::WBLogRegisteredEvent(std::int32_t number, std::string_view name,
                                        const Dictionary& record) {
  const std::lock_guard lock(_mutex);
  try {
    append(powerLogLine(_clock.now(), number, name, record));
    _failing = false;
  } catch (const std::system_error& error) {
    if (!_failing) {
      asl_log(_log, LogLevel::Warning, "Can't write the power log {}: {}", _path.string(), error.what());
    }
    _failing = true;
    throw;
  }
}

void FilePowerLog::append(std::string_view line) const {
  OpenFile file = openFile();
  if (file.bytes > 0 && static_cast<std::size_t>(file.bytes) + line.size() > _maximumFileBytes) {
    file.descriptor.reset();
    retireFile();
    file = openFile();
  }
  if (const auto error = appendWhole(file.descriptor.get(), line)) throw std::system_error(error, "write");
}

FilePowerLog::OpenFile FilePowerLog::openFile() const {
  std::filesystem::create_directories(_path.parent_path());
  OpenFile file;
  // Not blocking, so that a pipe in the file's place is refused instead of waited for.
  file.descriptor = FileDescriptor(::open(
      _path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY, kMode));
  if (!file.descriptor) fail("open");
  struct stat status {};
  if (::fstat(file.descriptor.get(), &status) != 0) fail("fstat");
  if (!S_ISREG(status.st_mode)) {
    errno = EINVAL;
    fail("not a regular file");
  }
  file.bytes = status.st_size;
  return file;
}

void FilePowerLog::retireFile() const {
  auto retired = _path;
  retired += ".1";
  if (::rename(_path.c_str(), retired.c_str()) != 0) fail("rename");
}

}  // namespace tallyd::platform
