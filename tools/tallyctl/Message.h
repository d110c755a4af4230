// One message to report, and how it is written on the command line and in files.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"
#include "tallyctl/Parsed.h"

namespace tallyd::tallyctl {

struct Message {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<platform::Dictionary> payload;
  bool operator==(const Message&) const = default;
};

/// Reads {"category": N, "type": N, "payload": {…}}; the payload may be missing or null, any other key is an
/// error, so that a misspelt one is noticed, and so is a key that comes twice.
[[nodiscard]] Parsed<Message> messageFromJSON(std::string_view text);

/// Reads KEY=VALUE or KEY:=JSON. A VALUE that is a boolean or a number as JSON writes it becomes one, every
/// other VALUE is a string.
[[nodiscard]] Parsed<platform::Dictionary::Entry> parseAssignment(std::string_view text);

/// All of them as one dictionary; a key that comes twice is an error.
[[nodiscard]] Parsed<platform::Dictionary> parseAssignments(const std::vector<std::string>& texts);

}  // namespace tallyd::tallyctl
