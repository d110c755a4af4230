#include "tallyctl/Console.h"

#include <fmt/format.h>

#include <cerrno>

#include "platform/JSON.h"

namespace tallyd::tallyctl {

void Console::print(std::string_view line) {
  const std::lock_guard lock(_mutex);
  eraseProgress();
  errno = 0;
  _out << line << '\n' << std::flush;
  // The stream knows only that it failed; its write left the reason in errno. The first one counts.
  if (!_out && _outputError == 0) _outputError = errno;
}

void Console::printObject(const platform::Dictionary& object) {
  print(platform::jsonFromValue(object).value_or(""));
}

void Console::tell(std::string_view line, const platform::Dictionary& object) {
  isJSON() ? printObject(object) : print(line);
}

void Console::note(std::string_view line) {
  const std::lock_guard lock(_mutex);
  eraseProgress();
  _err << line << '\n' << std::flush;
}

void Console::complain(std::string_view line) {
  const std::lock_guard lock(_mutex);
  eraseProgress();
  _err << "tallyctl: " << line << '\n' << std::flush;
}

void Console::showProgress(std::string_view text) {
  if (!showsProgress()) return;
  const std::lock_guard lock(_mutex);
  eraseProgress();
  _err << text << std::flush;
  _progressStands = true;
}

void Console::showElapsed(std::string_view subject, std::chrono::duration<double> time) {
  if (showsProgress()) showProgress(fmt::format("{}, {:.0f} s", subject, time.count()));
}

void Console::clearProgress() {
  const std::lock_guard lock(_mutex);
  eraseProgress();
}

bool Console::failed() const {
  const std::lock_guard lock(_mutex);
  return !_out;
}

int Console::outputError() const {
  const std::lock_guard lock(_mutex);
  return _outputError;
}

void Console::eraseProgress() {
  if (!_progressStands) return;
  _err << "\r\x1B[K" << std::flush;  // ECMA-48, "EL": erase to the end of the line.
  _progressStands = false;
}

}  // namespace tallyd::tallyctl
