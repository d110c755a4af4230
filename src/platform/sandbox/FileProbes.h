// Tries what a confined process must not be able to do with files.
#pragma once

#include <string>
#include <vector>

namespace tallyd::platform {

/// What this process could do to places that no profile may open, as a text each: "read /tmp". Places that
/// are not there, and those that the system's own permissions shut, count as shut.
///
/// Nothing is changed: what is opened is closed at once and neither read nor written, new files have no name,
/// and the folders whose removal is tried are never empty.
[[nodiscard]] std::vector<std::string> reachableFiles();

}  // namespace tallyd::platform
