// Plays a scenario to the daemon's core.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "replay/Received.h"
#include "replay/Scenario.h"

namespace tallyd::replay {

/// What a day came to.
struct Outcome {
  std::string trace;
  std::size_t traceLines = 0;
  std::size_t violationCount = 0;
  std::vector<std::string> violations;  ///< The first of them.
  Received received;
  std::size_t connections = 0;
  std::size_t calls = 0;
  std::size_t messageLogsDeleted = 0;
  std::optional<bool> isDrainSettled{};            ///< Nothing without a drain.
  std::map<std::string, std::uint64_t> dropped{};  ///< By reason.
};

/// Runs the whole day on this thread, without waiting. Uses a folder of its own for files; one simulation at
/// a time in a process.
[[nodiscard]] Outcome simulate(const Scenario& scenario);

/// "3 sessions, 5 calls, …": one line for people.
[[nodiscard]] std::string summary(const Outcome& outcome);

/// The day that this seed and length stand for where nothing else is said: withFaults(makeScenario(…)), with
/// the faults of the next seed.
[[nodiscard]] Scenario dayOfSeed(std::uint64_t seed, std::chrono::hours length);

/// What runs this day again: the replay script with its options. Nothing for a day that was written by hand.
[[nodiscard]] std::optional<std::string> commandFor(const Scenario& scenario);

}  // namespace tallyd::replay
