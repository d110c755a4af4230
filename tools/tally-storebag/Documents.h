// Documents as they are posted, made readable.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/HTTPClient.h"

namespace tallyd::storebagtool {

/// JSON on several lines, otherwise as it stands: order of keys, numbers and texts. The text itself when it
/// is no JSON.
[[nodiscard]] std::string indentedJSON(std::string_view json);

/// The contents of a gzip member (RFC 1952); nothing when the bytes are none.
[[nodiscard]] std::optional<std::string> gunzipped(std::string_view bytes);

/// The document that a request carries, out of its encoding.
[[nodiscard]] std::string documentOf(const platform::HTTPRequest& request);

}  // namespace tallyd::storebagtool
