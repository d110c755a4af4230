// The daemon's books as a table, and the check that they balance.
#pragma once

#include <string>
#include <vector>

#include "platform/Value.h"

namespace tallyd::tallyctl {

struct StatsReport {
  std::vector<std::string> lines;
  std::vector<std::string> imbalances;  ///< One for each account that does not add up; none when all do.
};

/// @param stats  what TallyInspection::statsSync() gives. What is missing in it counts as 0.
[[nodiscard]] StatsReport reportOf(const platform::Dictionary& stats);

}  // namespace tallyd::tallyctl
