#include "station/LossModel.h"

#include <charconv>
#include <cmath>

namespace tallyd::station {

std::optional<Share> Share::ofPercentage(std::string_view text) {
  constexpr double kHundredPercent = 100;
  if (text.ends_with('%')) text.remove_suffix(1);
  double percentage = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), percentage);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  if (!(percentage >= 0 && percentage <= kHundredPercent)) return std::nullopt;
  return Share(static_cast<std::uint64_t>(std::llround(percentage / kHundredPercent * kWhole)));
}

LossModel::Fate LossModel::next() {
  const bool isLost = drawn(_shares.lost);
  const bool isDuplicated = drawn(_shares.duplicated);
  const bool isReordered = drawn(_shares.reordered);
  return isLost ? Fate{.isLost = true} : Fate{false, isDuplicated, isReordered};
}

}  // namespace tallyd::station
