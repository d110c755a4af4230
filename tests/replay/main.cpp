// Replays simulated days by hand.

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <fstream>
#include <random>

#include "replay/ReplayOptions.h"
#include "replay/Simulation.h"

namespace {

using tallyd::replay::Outcome;
using tallyd::replay::Recipe;
using tallyd::replay::Scenario;

/// Whether the day went as it should.
bool replay(const Recipe& recipe, const std::string& trace) {
  const auto started = std::chrono::steady_clock::now();
  const Scenario day = tallyd::replay::scenarioOf(recipe);
  const Outcome outcome = simulate(day);
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - started;
  fmt::print("seed {}, {} h in {:.2f} s, opt-ins: {}: {}\n", recipe.seed, recipe.length.count(), took.count(),
             description(day.optIns), summary(outcome));
  if (!trace.empty()) std::ofstream(trace) << outcome.trace;
  for (const std::string& violation : outcome.violations) fmt::print("  VIOLATED {}\n", violation);
  if (outcome.violationCount == 0) return true;
  fmt::print("  {} violations; again with: {}\n", outcome.violationCount, commandFor(day).value());
  return false;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"Plays simulated days to the daemon's core and checks what must always hold."};
  const tallyd::replay::ReplayOptions options(app);
  int random = 0;
  std::string trace;
  app.add_option("--random", random, "This many days of random seeds instead")->check(CLI::Range(1, 100'000));
  app.add_option("--trace", trace, "File for all that happened");
  app.footer(
      "Example: scripts/replay --seed 7 --hours 24 --trace /tmp/day.txt\nExit status 1 when something was "
      "violated.");
  CLI11_PARSE(app, argc, argv);
  bool isFine = true;
  if (random == 0) isFine = replay(options.recipe(), trace);
  std::random_device seeds;
  for (int i = 0; i < random; ++i) isFine = replay(options.recipe(seeds()), trace) && isFine;
  return isFine ? EXIT_SUCCESS : EXIT_FAILURE;
}
