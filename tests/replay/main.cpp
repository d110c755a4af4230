// Replays simulated days by hand.

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <fstream>
#include <random>

#include "replay/Simulation.h"

namespace {

using tallyd::replay::Outcome;

struct Options {
  std::uint64_t seed = 1;
  int hours = 24;
  int random = 0;
  bool fine = false;
  std::string trace;
};

/// Whether the day went as it should.
bool replay(std::uint64_t seed, const Options& options) {
  const std::chrono::hours length(options.hours);
  const auto started = std::chrono::steady_clock::now();
  const Outcome outcome = simulate(options.fine ? tallyd::replay::makeScenario(seed, length)
                                                : tallyd::replay::dayOfSeed(seed, length));
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - started;
  fmt::print("seed {}, {} h in {:.2f} s: {}\n", seed, options.hours, took.count(), summary(outcome));
  if (!options.trace.empty()) std::ofstream(options.trace) << outcome.trace;
  for (const std::string& violation : outcome.violations) fmt::print("  VIOLATED {}\n", violation);
  if (outcome.violationCount == 0) return true;
  fmt::print("  {} violations; again with: {}\n", outcome.violationCount,
             tallyd::replay::commandFor(seed, length));
  return false;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"Plays simulated days to the daemon's core and checks what must always hold."};
  Options options;
  app.add_option("--seed", options.seed, "Which day; default 1");
  app.add_option("--hours", options.hours, "How long it is; default 24")->check(CLI::Range(1, 240));
  app.add_option("--random", options.random, "This many days of random seeds instead")
      ->check(CLI::Range(1, 100'000));
  app.add_flag("--fine", options.fine, "Without faults");
  app.add_option("--trace", options.trace, "File for all that happened");
  app.footer(
      "Example: scripts/replay --seed 7 --hours 24 --trace /tmp/day.txt\nExit status 1 when something was "
      "violated.");
  CLI11_PARSE(app, argc, argv);
  bool isFine = true;
  if (options.random == 0) isFine = replay(options.seed, options);
  std::random_device seeds;
  for (int i = 0; i < options.random; ++i) isFine = replay(seeds(), options) && isFine;
  return isFine ? EXIT_SUCCESS : EXIT_FAILURE;
}
