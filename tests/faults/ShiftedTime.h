// The time of day of a real program, set by the test while the program runs.
#pragma once

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <chrono>
#include <map>
#include <string>
#include <system_error>

#include "fakes/TemporaryFolder.h"
#include "faults/ShiftedTimeFile.h"
#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// Sets the clock of every program that is started with its environment: what the program is told of the time
/// of day jumps, steady clocks go on, as when a device's clock is set. The kernel's clock stays right: the
/// dates of files are its own.
///
/// Not in a build with a sanitizer, whose runtime would have to come before the preloaded library.
class ShiftedTime {
 public:
  ShiftedTime() : _path(_folder.path() / "shift") {
    const platform::FileDescriptor file(::open(_path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    if (!file || ::ftruncate(file.get(), sizeof(TimeShift)) != 0) throwError();
    void* mapping = ::mmap(nullptr, sizeof(TimeShift), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
    if (mapping == MAP_FAILED) throwError();
    _shift = static_cast<TimeShift*>(mapping);
  }
  ~ShiftedTime() { ::munmap(_shift, sizeof(TimeShift)); }
  ShiftedTime(const ShiftedTime&) = delete;
  ShiftedTime& operator=(const ShiftedTime&) = delete;

  /// What a program is to be started with.
  [[nodiscard]] std::map<std::string, std::string> environment() const {
    return {{"LD_PRELOAD", TALLYD_SHIFTED_TIME_LIBRARY}, {kShiftedTimeVariable, _path.string()}};
  }
  /// Sets the programs' clocks forward, or backward; at once.
  void advance(std::chrono::seconds by) { _shift->fetch_add(by.count()); }
  /// What the programs are told, in seconds since 1970.
  [[nodiscard]] std::int64_t now() const {
    const auto real = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::seconds>(real).count() + _shift->load();
  }

 private:
  [[noreturn]] void throwError() const {
    throw std::system_error(errno, std::generic_category(), _path.string());
  }

  const fakes::TemporaryFolder _folder;
  const std::filesystem::path _path;
  TimeShift* _shift = nullptr;
};

}  // namespace tallyd::test
