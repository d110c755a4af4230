#include "tallyctl/Console.h"

namespace tallyd::tallyctl {

void Console::print(std::string_view line) {
  const std::lock_guard lock(_mutex);
  eraseProgress();
  _out << line << '\n' << std::flush;
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

void Console::clearProgress() {
  const std::lock_guard lock(_mutex);
  eraseProgress();
}

bool Console::failed() const {
  const std::lock_guard lock(_mutex);
  return !_out;
}

void Console::eraseProgress() {
  if (!_progressStands) return;
  _err << "\r\x1B[K" << std::flush;  // ECMA-48, "EL": erase to the end of the line.
  _progressStands = false;
}

}  // namespace tallyd::tallyctl
