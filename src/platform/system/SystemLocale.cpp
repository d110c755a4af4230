#include "platform/system/SystemLocale.h"

#include <unicode/locid.h>

#include <cstdlib>
#include <ctime>

namespace tallyd::platform {

SystemLocale::SystemLocale() {
  const std::string_view country = icu::Locale::getDefault().getCountry();
  if (!country.empty()) _countryCode = country;
}

std::chrono::seconds SystemLocale::offsetFromGMT(TimePoint time) const {
  followZone();
  const auto seconds = std::chrono::floor<std::chrono::seconds>(time.time_since_epoch()).count();
  const auto when = static_cast<std::time_t>(seconds);
  std::tm local{};
  if (!::localtime_r(&when, &local)) return std::chrono::seconds(0);
  return std::chrono::seconds(local.tm_gmtoff);
}

/// localtime_r alone looks at the zone only once in a process. To look costs a system call, so that it is
/// done once a second; another TZ is seen at once.
void SystemLocale::followZone() const {
  const char* variable = std::getenv("TZ");
  timespec now{};
  ::clock_gettime(CLOCK_MONOTONIC_COARSE, &now);
  const std::int64_t second = now.tv_sec + 1;  // 0 stands for never.
  const bool isSame = _lastVariable.load(std::memory_order_relaxed) == variable;
  if (isSame && _lastLook.exchange(second, std::memory_order_relaxed) == second) return;
  _lastVariable.store(variable, std::memory_order_relaxed);
  _lastLook.store(second, std::memory_order_relaxed);
  ::tzset();
}

}  // namespace tallyd::platform
