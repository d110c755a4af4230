// The replay program's options that say which day is played.
#pragma once

#include <CLI/CLI.hpp>

#include "replay/Scenario.h"

namespace tallyd::replay {

/// Adds --seed, --hours, --faults and --fine to a command line.
class ReplayOptions {
 public:
  /// `app` keeps references to this object.
  explicit ReplayOptions(CLI::App& app);
  ReplayOptions(const ReplayOptions&) = delete;
  ReplayOptions& operator=(const ReplayOptions&) = delete;

  /// What the parsed options ask for, on the day of their seed or of another.
  [[nodiscard]] Recipe recipe() const { return recipe(_seed); }
  [[nodiscard]] Recipe recipe(std::uint64_t seed) const;

 private:
  std::uint64_t _seed = 1;
  int _hours = 24;
  std::optional<std::uint64_t> _faults;
  bool _fine = false;
};

}  // namespace tallyd::replay
