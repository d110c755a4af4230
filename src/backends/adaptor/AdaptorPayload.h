// Payloads in the form in which adaptors take them.
#pragma once

#include <optional>
#include <string>

#include "platform/Log.h"
#include "platform/Value.h"

namespace tallyd {

/// `payload` as a binary property list. Values that such a list can't hold (null, dates outside the years 1
/// to 9999, containers that are nested too deep) are left out, which costs one warning that counts them;
/// nothing, after an error line, when the list would still be too large to be written.
[[nodiscard]] std::optional<std::string> adaptorPayload(const platform::Dictionary& payload,
                                                        platform::Log& log);

}  // namespace tallyd
