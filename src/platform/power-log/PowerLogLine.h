// One event of the power log as a line of text.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/Clock.h"
#include "platform/Value.h"

namespace tallyd::platform {

/// A JSON object and a line feed:
/// {"time": SECONDS, "number": NUMBER, "name": "NAME", "record": {…}}, where SECONDS count from 1970, to
/// the microsecond.
///
/// What JSON can't take is written in another way: dates as seconds since 1970, data in Base64 (RFC 4648),
/// numbers that are not finite and containers deeper than kMaximumValueDepth as null, and the replacement
/// character for what is no UTF-8.
[[nodiscard]] std::string powerLogLine(TimePoint time, std::int32_t number, std::string_view name,
                                       const Dictionary& record);

}  // namespace tallyd::platform
