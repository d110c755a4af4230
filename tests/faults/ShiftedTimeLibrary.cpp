// Preloaded into a program under test: the time of day, shifted by what the test writes while the program
// runs. The file is mapped before main(), and so before a sandbox; clocks that no one sets stay what they
// are.

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "faults/ShiftedTimeFile.h"

namespace {

using tallyd::test::TimeShift;

[[noreturn]] void giveUp(const char* what) {
  std::perror(what);
  std::abort();
}

const TimeShift* mappedShift() {
  const char* path = std::getenv(tallyd::test::kShiftedTimeVariable);
  const int file = ::open(path ? path : "", O_RDONLY | O_CLOEXEC);
  if (file < 0) giveUp(tallyd::test::kShiftedTimeVariable);
  void* mapping = ::mmap(nullptr, sizeof(TimeShift), PROT_READ, MAP_SHARED, file, 0);
  if (mapping == MAP_FAILED) giveUp("mmap");
  ::close(file);
  return static_cast<const TimeShift*>(mapping);
}

/// Null until this library's own start: other libraries may ask for the time in theirs.
const TimeShift* const shift = mappedShift();

bool isTimeOfDay(clockid_t clock) { return clock == CLOCK_REALTIME || clock == CLOCK_REALTIME_COARSE; }

}  // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* time) noexcept {
  const long result = ::syscall(SYS_clock_gettime, clock, time);
  if (result == 0 && shift && isTimeOfDay(clock)) time->tv_sec += shift->load();
  return static_cast<int>(result);
}

int gettimeofday(timeval* time, void*) noexcept {
  timespec now{};
  if (clock_gettime(CLOCK_REALTIME, &now) != 0) return -1;
  constexpr long kNanosecondsOfAMicrosecond = 1000;
  *time = {now.tv_sec, now.tv_nsec / kNanosecondsOfAMicrosecond};
  return 0;
}

time_t time(time_t* result) noexcept {
  timespec now{};
  if (clock_gettime(CLOCK_REALTIME, &now) != 0) return -1;
  if (result) *result = now.tv_sec;
  return now.tv_sec;
}

}  // extern "C"
