#include "Report.h"

#include <fmt/format.h>

#include <algorithm>

#include "Measure.h"
#include "platform/JSON.h"

namespace tallyd::bench {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

/// Three digits that mean something.
std::string shown(double number) {
  if (number >= 1000) return fmt::format("{:.0f}", number);
  return number >= 100 ? fmt::format("{:.1f}", number) : fmt::format("{:.2f}", number);
}

Value arrayOf(const std::vector<double>& numbers) {
  return Array(std::vector<Value>(numbers.begin(), numbers.end()));
}

}  // namespace

bool Settings::wants(std::string_view name) const { return name.starts_with(only) || only.starts_with(name); }

double Figure::ratio() const {
  const double value = median(values);
  const double floor = median(floors);
  return better == Better::Lower ? value / floor : floor / value;
}

std::string tableOf(const std::vector<Figure>& figures) {
  std::string table =
      fmt::format("{:<36}{:>12}{:>12}{:>8}  {:<12}{}\n", "", "figure", "floor", "ratio", "unit", "floor is");
  for (const Figure& figure : figures) {
    table += fmt::format("{:<36}{:>12}{:>12}{:>8.2f}  {:<12}{}\n", figure.name, shown(median(figure.values)),
                         shown(median(figure.floors)), figure.ratio(), figure.unit, figure.floorName);
  }
  return table;
}

std::string jsonOf(const std::vector<Figure>& figures) {
  std::vector<Value> list;
  for (const Figure& figure : figures) {
    list.emplace_back(Dictionary{{"name", figure.name},
                                 {"unit", figure.unit},
                                 {"floorName", figure.floorName},
                                 {"figure", median(figure.values)},
                                 {"floor", median(figure.floors)},
                                 {"ratio", figure.ratio()},
                                 {"values", arrayOf(figure.values)},
                                 {"floors", arrayOf(figure.floors)}});
  }
  return platform::jsonFromValue(Dictionary{{"figures", Array(std::move(list))}}).value_or("") + "\n";
}

}  // namespace tallyd::bench
