// Log data that is uploaded as one array, from files of several forms.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"
#include "tallyctl/Parsed.h"

namespace tallyd::tallyctl {

/// All files of one upload together. One call carries at most 64 MiB of array (D-Bus specification, "Valid
/// Signatures and Marshaling": arrays), in which a short number takes several times its text.
inline constexpr std::size_t kMaximumLogDataBytes = std::size_t{16} << 20;

/// The elements that one file's content gives. What it is, the content tells: JSON, or a property list (XML,
/// binary, ASCII), is one element; of JSON lines each line that is not blank is one. An error in a line
/// starts with "LINE: ", any other with " ", so that both go behind "FILE:".
[[nodiscard]] Parsed<std::vector<platform::Value>> logDataFromContent(std::string_view content);

struct LogData {
  platform::Array elements;
  std::size_t bytes = 0;  ///< Of the files.
};

/// The elements of all files in their order; "-" is the standard input. Throws std::system_error or Failure
/// that name the file, and the line where there is one.
[[nodiscard]] LogData readLogData(const std::vector<std::string>& files, int standardInput);

}  // namespace tallyd::tallyctl
