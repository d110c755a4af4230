// Where the user is, as the system's settings say.
#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "platform/Clock.h"

namespace tallyd::platform {

/// Threading: any thread.
class Locale {
 public:
  virtual ~Locale() = default;

  /// The country code of the default locale, such as "DE"; nothing when the locale names no country.
  [[nodiscard]] virtual std::optional<std::string> countryCode() const = 0;

  /// What the local time zone adds to GMT at `time`; negative west of Greenwich.
  [[nodiscard]] virtual std::chrono::seconds offsetFromGMT(TimePoint time) const = 0;
};

}  // namespace tallyd::platform
