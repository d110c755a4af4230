// Options of a command line whose values have a range.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "platform/Value.h"

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace tallyd::tallyctl {

/// Both ends belong to it.
struct IntegerRange {
  std::int64_t least = std::numeric_limits<std::int64_t>::min();
  std::int64_t most = std::numeric_limits<std::int64_t>::max();
};

/// An option that takes one whole decimal number and hands it to `store`. A value out of range is refused
/// with "OPTION VALUE: must be LEAST to MOST".
CLI::Option* addInteger(CLI::App& command, const std::string& name, const std::string& text,
                        IntegerRange range, std::function<void(std::int64_t)> store);

/// The same for all numbers of a type of up to 32 bits. Borrows `target`, a number or an optional one.
template <class Number, class Target>
CLI::Option* addInteger(CLI::App& command, const std::string& name, const std::string& text, Target& target) {
  static_assert(sizeof(Number) <= sizeof(std::int32_t));
  using Limits = std::numeric_limits<Number>;
  return addInteger(command, name, text, {Limits::min(), Limits::max()},
                    [&target](std::int64_t value) { target = static_cast<Number>(value); });
}

/// An option that counts something, from 1. Borrows `target`.
CLI::Option* addCount(CLI::App& command, const std::string& name, const std::string& text,
                      std::uint64_t& target);

/// An option that takes seconds, with fractions, from `least` to a day; what it holds is the default. Borrows
/// `target`.
CLI::Option* addSeconds(CLI::App& command, const std::string& name, const std::string& text, double least,
                        std::chrono::milliseconds& target);

/// An option that takes a text; the empty one is refused. Borrows `target`, which holds the default.
CLI::Option* addText(CLI::App& command, const std::string& name, const std::string& text,
                     std::string& target);

/// Has every value of the option be KEY=VALUE or KEY:=JSON.
CLI::Option* takeAssignments(CLI::Option* option);

/// The values of such an option; a key that comes twice is refused in the name of `what`.
[[nodiscard]] platform::Dictionary dictionaryFrom(const std::string& what,
                                                  const std::vector<std::string>& assignments);

}  // namespace tallyd::tallyctl
