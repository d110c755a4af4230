// The JSON document that carries events to a collector.
#pragma once

#include <sys/time.h>

#include <optional>
#include <string>
#include <vector>

#include "platform/Log.h"
#include "platform/Value.h"

namespace tallyd {

/// Makes an event fit for JSON: dates become their seconds since 1970 as text, strings and finite numbers
/// stay, everything else is removed with a warning line each.
void sanitizeEventForJSON(platform::Dictionary& event, platform::Log& log);

/// The document: "postTime" (seconds, a point, milliseconds padded with blanks), "clientId", "events".
/// Without a client identifier it ends behind "postTime".
[[nodiscard]] std::optional<std::string> postBody(const timeval& postTime,
                                                  const std::optional<std::string>& clientId,
                                                  std::vector<platform::Dictionary> events);

}  // namespace tallyd
