// The bag that "tally-storebag new" writes.
#pragma once

#include <string_view>

namespace tallyd::storebagtool {

/// An XML property list with every backend and every key, and a comment on each.
[[nodiscard]] std::string_view startingBag();

}  // namespace tallyd::storebagtool
