// The figures of one run, each beside its floor: collected, then shown as a table and as JSON.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tallyd::bench {

/// How the command line wants the run to be.
struct Settings {
  bool quick = false;   ///< Fewer and shorter runs.
  bool sandbox = true;  ///< The daemon is confined, as it is where it is installed.
  std::string only;     ///< Beginning of the names of the figures wanted; empty for all.
  std::string program;  ///< The daemon's path.
  std::string sources;  ///< The source tree, for what the daemon's root takes from it.

  /// Of each figure, and of its floor.
  [[nodiscard]] int runs() const { return quick ? 3 : 7; }
  /// Whether a figure of this name is wanted, or any of a group "NAME/".
  [[nodiscard]] bool wants(std::string_view name) const;
};

enum class Better { Lower, Higher };

/// What a figure is not to be worse than.
struct Target {
  enum class Of {
    Ratio,  ///< The limit is for Figure::ratio().
    Figure  ///< The limit is for the figure itself, in its unit.
  };
  Of of = Of::Ratio;
  double limit = 0;

  [[nodiscard]] static Target ratio(double limit) { return {Of::Ratio, limit}; }
  [[nodiscard]] static Target figure(double limit) { return {Of::Figure, limit}; }
};

/// One figure: what each run measured, and what each run's floor was.
struct Figure {
  std::string name;
  std::string unit;
  std::string floorName;
  Better better = Better::Lower;
  std::optional<Target> target{};
  std::string leftOut{};  ///< Why it can't be measured here; then there are no values, and no floors.
  std::vector<double> values{};
  std::vector<double> floors{};

  void add(double value, double floor) {
    values.push_back(value);
    floors.push_back(floor);
  }
  /// How many times the floor's cost the figure is, of the medians; 1 is the floor itself.
  [[nodiscard]] double ratio() const;
  /// Of the medians; nothing without a target, and for a figure that was left out.
  [[nodiscard]] std::optional<bool> meetsTarget() const;
};

/// Lines as wide as a terminal's, with a heading.
[[nodiscard]] std::string tableOf(const std::vector<Figure>& figures);
/// {"figures": [{"name", "unit", "floorName", "figure", "floor", "ratio", "target", "targetOf", "met",
/// "values", "floors"}]}: "targetOf" is "ratio" or "figure" and missing, like "target", where there is none;
/// "met" is "yes", "no" or "-". A figure that was left out has "name", "unit" and "leftOut", the reason.
[[nodiscard]] std::string jsonOf(const std::vector<Figure>& figures);

}  // namespace tallyd::bench
