// Something for a log line that takes more memory to write than there is.
#pragma once

#include <fmt/format.h>

#include <new>
#include <utility>

namespace tallyd::fakes {

/// Formatting one throws std::bad_alloc.
struct TooLarge {};

}  // namespace tallyd::fakes

template <>
struct fmt::formatter<tallyd::fakes::TooLarge> {
  constexpr auto parse(format_parse_context& context) { return context.begin(); }
  template <class Context>
  auto format(const tallyd::fakes::TooLarge&, Context&) const -> decltype(std::declval<Context>().out()) {
    throw std::bad_alloc();
  }
};
