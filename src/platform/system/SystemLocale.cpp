#include "platform/system/SystemLocale.h"

#include <unicode/locid.h>

#include <ctime>

namespace tallyd::platform {

SystemLocale::SystemLocale() {
  const std::string_view country = icu::Locale::getDefault().getCountry();
  if (!country.empty()) _countryCode = country;
}

std::chrono::seconds SystemLocale::offsetFromGMT(TimePoint time) const {
  ::tzset();  // localtime_r alone looks at the zone only once in a process.
  const auto seconds = std::chrono::floor<std::chrono::seconds>(time.time_since_epoch()).count();
  const auto when = static_cast<std::time_t>(seconds);
  std::tm local{};
  if (!::localtime_r(&when, &local)) return std::chrono::seconds(0);
  return std::chrono::seconds(local.tm_gmtoff);
}

}  // namespace tallyd::platform
