// Reporting states for the output.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/Value.h"

namespace tallyd::tallyctl {

/// "a, b", "none", or "no storebag" when there are no states.
[[nodiscard]] std::string statesText(const std::optional<std::vector<std::string>>& states);

/// The same as an array; null when there are no states.
[[nodiscard]] platform::Value statesValue(const std::optional<std::vector<std::string>>& states);

/// Why nothing that is sent gets anywhere.
[[nodiscard]] std::string noStorebagText(std::int32_t clientType);

}  // namespace tallyd::tallyctl
