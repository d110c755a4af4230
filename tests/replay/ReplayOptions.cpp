#include "replay/ReplayOptions.h"

namespace tallyd::replay {

ReplayOptions::ReplayOptions(CLI::App& app) {
  app.add_option("--seed", _seed, "Which day; default 1");
  app.add_option("--hours", _hours, "How long it is; default 24")->check(CLI::Range(1, 240));
  auto* faults = app.add_option("--faults", _faults, "Which faults it has; default: those of the next seed");
  app.add_flag("--fine", _fine, "Without faults")->excludes(faults);
}

Recipe ReplayOptions::recipe(std::uint64_t seed) const {
  Recipe recipe{.seed = seed, .length = std::chrono::hours(_hours)};
  if (!_fine) recipe.faults = _faults.value_or(seed + 1);
  return recipe;
}

}  // namespace tallyd::replay
