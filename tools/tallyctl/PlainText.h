// Text from outside on a terminal.
#pragma once

#include <string>
#include <string_view>

namespace tallyd::tallyctl {

/// The text as it is, or as a JSON string when there are control characters in it, which a terminal would
/// obey.
[[nodiscard]] std::string plainText(std::string_view text);

}  // namespace tallyd::tallyctl
