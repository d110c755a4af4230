// The tap's lines for people.
#pragma once

#include <string>
#include <string_view>

namespace tallyd::tallyctl {

/// One line, without control characters: local time of day, session, backend, and what happened. What is no
/// JSON object, and a kind that is unknown, is shown as it came.
[[nodiscard]] std::string tapText(std::string_view line);

}  // namespace tallyd::tallyctl
