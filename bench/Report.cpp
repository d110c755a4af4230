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

const char* metTextOf(const Figure& figure) {
  const auto met = figure.meetsTarget();
  if (!met) return "-";
  return *met ? "yes" : "no";
}

/// A ratio stands alone, another limit with its unit.
std::string targetTextOf(const Figure& figure) {
  if (!figure.target) return "-";
  const Target& target = *figure.target;
  return target.of == Target::Of::Ratio ? shown(target.limit)
                                        : fmt::format("{:g} {}", target.limit, figure.unit);
}

std::string lineOf(const Figure& figure) {
  if (figure.values.empty()) return fmt::format("{:<36}  left out: {}", figure.name, figure.leftOut);
  return fmt::format("{:<36}{:>12}{:>12}{:>8.2f}{:>9}  {:<5}{:<11}{}", figure.name,
                     shown(median(figure.values)), shown(median(figure.floors)), figure.ratio(),
                     targetTextOf(figure), metTextOf(figure), figure.unit, figure.floorName);
}

Dictionary dictionaryOf(const Figure& figure) {
  Dictionary members{{"name", figure.name}, {"unit", figure.unit}};
  if (figure.values.empty()) {
    members.set("leftOut", figure.leftOut);
    return members;
  }
  members.set("floorName", figure.floorName);
  members.set("figure", median(figure.values));
  members.set("floor", median(figure.floors));
  members.set("ratio", figure.ratio());
  if (figure.target) {
    members.set("target", figure.target->limit);
    members.set("targetOf", figure.target->of == Target::Of::Ratio ? "ratio" : "figure");
  }
  members.set("met", metTextOf(figure));
  members.set("values", arrayOf(figure.values));
  members.set("floors", arrayOf(figure.floors));
  return members;
}

}  // namespace

bool Settings::wants(std::string_view name) const { return name.starts_with(only) || only.starts_with(name); }

double Figure::ratio() const {
  const double value = median(values);
  const double floor = median(floors);
  return better == Better::Lower ? value / floor : floor / value;
}

std::optional<bool> Figure::meetsTarget() const {
  if (!target || values.empty()) return std::nullopt;
  if (target->of == Target::Of::Ratio) return ratio() <= target->limit;
  const double figure = median(values);
  return better == Better::Lower ? figure <= target->limit : figure >= target->limit;
}

std::string tableOf(const std::vector<Figure>& figures) {
  std::string table = fmt::format("{:<36}{:>12}{:>12}{:>8}{:>9}  {:<5}{:<11}{}\n", "", "figure", "floor",
                                  "ratio", "target", "met", "unit", "floor is");
  for (const Figure& figure : figures) table += lineOf(figure) + "\n";
  return table;
}

std::string jsonOf(const std::vector<Figure>& figures) {
  std::vector<Value> list;
  list.reserve(figures.size());
  for (const Figure& figure : figures) list.emplace_back(dictionaryOf(figure));
  return platform::jsonFromValue(Dictionary{{"figures", Array(std::move(list))}}).value_or("") + "\n";
}

}  // namespace tallyd::bench
