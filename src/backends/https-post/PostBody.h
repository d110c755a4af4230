// The JSON document that carries events to a collector.
#pragma once

#include <sys/time.h>

#include <optional>
#include <string>
#include <string_view>

#include "backends/https-post/EventFields.h"
#include "platform/JSON.h"
#include "platform/Log.h"

namespace tallyd {

/// Makes an event fit for JSON: dates become their seconds since 1970 as text, strings and finite numbers
/// stay, everything else is removed with a warning line each.
void sanitizeEventForJSON(EventFields& event, platform::Log& log);

/// Writes an event, which is fit for it, as an object.
void appendEvent(platform::JSONText& json, const EventFields& event);

/// The document: "postTime" (seconds, a point, milliseconds padded with blanks), "clientId", "events".
/// Without a client identifier it ends behind "postTime".
///
/// @param events  a JSON array.
[[nodiscard]] std::string postBody(const timeval& postTime, const std::optional<std::string>& clientId,
                                   std::string_view events);

}  // namespace tallyd
