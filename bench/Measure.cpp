#include "Measure.h"

#include <ctime>

#include <algorithm>
#include <fstream>
#include <stdexcept>
#include <string>
#include <system_error>

namespace tallyd::bench {

namespace {

double secondsOn(clockid_t clock) {
  timespec time{};
  if (clock_gettime(clock, &time) != 0) {
    throw std::system_error(errno, std::generic_category(), "clock_gettime");
  }
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

}  // namespace

double median(std::vector<double> values) {
  std::sort(values.begin(), values.end());
  const std::size_t middle = values.size() / 2;
  return values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
}

double processorSecondsOf(pid_t process) {
  clockid_t clock{};
  if (const int error = clock_getcpuclockid(process, &clock)) {
    throw std::system_error(error, std::generic_category(), "clock_getcpuclockid");
  }
  return secondsOn(clock);
}

double processorSecondsOfThisThread() { return secondsOn(CLOCK_THREAD_CPUTIME_ID); }

OneProcessor::OneProcessor() {
  cpu_set_t one;
  CPU_ZERO(&one);
  CPU_SET(static_cast<std::size_t>(sched_getcpu()), &one);
  if (sched_getaffinity(0, sizeof _before, &_before) != 0 || sched_setaffinity(0, sizeof one, &one) != 0) {
    throw std::system_error(errno, std::generic_category(), "sched_setaffinity");
  }
}

OneProcessor::~OneProcessor() { sched_setaffinity(0, sizeof _before, &_before); }

Memory memoryOf(pid_t process) {
  constexpr std::size_t kKibibyte = 1024;
  std::ifstream status("/proc/" + std::to_string(process) + "/status");
  Memory memory;
  for (std::string field; status >> field;) {
    if (field != "VmRSS:" && field != "VmHWM:") continue;
    std::size_t kibibytes = 0;
    status >> kibibytes;
    (field == "VmRSS:" ? memory.residentBytes : memory.peakBytes) = kibibytes * kKibibyte;
  }
  if (memory.residentBytes == 0) throw std::runtime_error("the process's memory can't be read");
  return memory;
}

}  // namespace tallyd::bench
