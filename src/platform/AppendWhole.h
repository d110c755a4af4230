// A text at the end of a file, as a whole or not at all.
#pragma once

#include <string_view>
#include <system_error>

namespace tallyd::platform {

/// Appends `text`. When not all of it can be written, as on a full disk, what was is taken back, so that the
/// next text does not begin in the middle of a line. Blocks on the disk.
///
/// @param file  opened with O_APPEND, and written by nobody else meanwhile.
/// @returns why the text could not be written; when even a part of it had to stay, why that could not be
/// taken back.
[[nodiscard]] std::error_code appendWhole(int file, std::string_view text);

}  // namespace tallyd::platform
