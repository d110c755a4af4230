// Base64 (RFC 4648, section 4).
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace tallyd::platform {

/// Standard alphabet, padded, without line breaks.
[[nodiscard]] std::string base64Encoded(std::string_view bytes);

/// Decodes, passing over every character outside the alphabet. Nothing when what is left is not whole groups
/// of four characters, padding included.
[[nodiscard]] std::optional<std::string> base64DecodedIgnoringUnknown(std::string_view text);

}  // namespace tallyd::platform
