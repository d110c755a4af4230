// JSON that is written by hand, read without leniency.
#pragma once

#include <string_view>

#include "platform/Value.h"
#include "tallyctl/Parsed.h"

namespace tallyd::tallyctl {

/// Reads one JSON text as platform::valueFromJSON() does. An object with a key that comes twice is an error
/// too, which names the key: one of its values would be lost without a word.
[[nodiscard]] Parsed<platform::Value> valueFromStrictJSON(std::string_view text);

}  // namespace tallyd::tallyctl
