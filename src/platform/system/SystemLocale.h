// The locale of the process's environment and the time zone of the system.
#pragma once

#include <atomic>
#include <cstdint>

#include "platform/Locale.h"

namespace tallyd::platform {

/// The country is that of ICU's default locale, which is the first of the environment variables LC_ALL,
/// LC_MESSAGES and LANG that is set. ICU takes "C", "POSIX" and an environment without any of them for
/// en_US_POSIX, whose country is "US"; a bare language, such as "de", names no country.
///
/// The time zone is that of the variable TZ, else of /etc/localtime; a change of the latter is seen within a
/// second.
class SystemLocale final : public Locale {
 public:
  /// Asks ICU; what the environment says afterwards changes nothing.
  SystemLocale();

  [[nodiscard]] std::optional<std::string> countryCode() const override { return _countryCode; }
  [[nodiscard]] std::chrono::seconds offsetFromGMT(TimePoint time) const override;

 private:
  void followZone() const;

  std::optional<std::string> _countryCode;
  mutable std::atomic<const char*> _lastVariable{nullptr};  ///< TZ as it was seen last.
  mutable std::atomic<std::int64_t> _lastLook{0};           ///< In seconds of the monotonic clock.
};

}  // namespace tallyd::platform
