// Values out of keyed archives.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::station {

struct ArchiveResult {
  std::optional<platform::Value> root;
  std::string problem;  ///< What is wrong; empty when there is a root.
};

/// Reads the root object of a keyed archive (a property list of "$archiver" "NSKeyedArchiver" whose objects
/// refer to each other by number).
///
/// Strings, numbers, booleans, data, dates, arrays, sets (as arrays), dictionaries and null become values; an
/// object of any other class, a dictionary of its members with its class's name under "$class". A key that is
/// no string becomes its description.
///
/// Never throws. Refused are objects that hold themselves, nesting deeper than a record may have, references
/// to nowhere, and archives that come to more than kMaximumExpandedArchiveBytes.
[[nodiscard]] ArchiveResult readKeyedArchive(std::string_view bytes);

}  // namespace tallyd::station
