// File URLs as clients hand them in.
#pragma once

#include <string>
#include <string_view>

namespace tallyd {

/// The path of a file URL (RFC 8089), percent-escapes undone; a text that is no URL is taken as the path
/// itself.
[[nodiscard]] std::string pathOfFileURL(std::string_view url);

}  // namespace tallyd
