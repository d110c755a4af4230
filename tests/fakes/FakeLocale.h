// A locale that the test sets.
#pragma once

#include "platform/Locale.h"

namespace tallyd::fakes {

class FakeLocale : public platform::Locale {
 public:
  [[nodiscard]] std::optional<std::string> countryCode() const override { return country; }
  [[nodiscard]] std::chrono::seconds offsetFromGMT(platform::TimePoint) const override { return offset; }

  std::optional<std::string> country = "DE";
  std::chrono::seconds offset{3600};
};

}  // namespace tallyd::fakes
