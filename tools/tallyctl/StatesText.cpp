#include "tallyctl/StatesText.h"

#include <fmt/format.h>

namespace tallyd::tallyctl {

std::string statesText(const std::optional<std::vector<std::string>>& states) {
  if (!states) return "no storebag";
  if (states->empty()) return "none";
  return fmt::format("{}", fmt::join(*states, ", "));
}

platform::Value statesValue(const std::optional<std::vector<std::string>>& states) {
  if (!states) return {};
  return platform::Array(std::vector<platform::Value>(states->begin(), states->end()));
}

std::string noStorebagText(std::int32_t clientType) {
  return fmt::format("the daemon has no storebag for client type {}: messages reach no backend", clientType);
}

}  // namespace tallyd::tallyctl
