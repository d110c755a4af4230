// When a post that failed is tried again.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>

#include "platform/Clock.h"
#include "platform/HTTPClient.h"
#include "platform/http/HTTPLimits.h"

namespace tallyd::platform {

struct RetryLimits {
  /// Attempts beyond the first.
  unsigned attempts = 0;
  /// The wait before the first of them is drawn from [0, this); each further one's range is twice as wide.
  std::chrono::milliseconds firstBackoff{2'000};
  /// As wide as the range becomes: a collector that is back is noticed within minutes.
  std::chrono::milliseconds longestBackoff{300'000};
  /// No attempt begins later than this after the first. What waits that long costs memory, and is old news.
  std::chrono::milliseconds totalTime{900'000};
  /// What posts hold from their first attempt to their last.
  std::size_t maximumPendingBytes = HTTPLimits().maximumPendingBytes;
};

/// What has come of a post so far.
struct FailedAttempt {
  unsigned retries = 0;               ///< Made already.
  std::chrono::milliseconds elapsed;  ///< Since the first attempt began.
  TimePoint now;                      ///< The time of day, for the server's dates.
};

/// Whether another attempt may end otherwise: the transfer failed on its way, or the server says that it
/// can't at present (429, 502, 503, 504; RFC 9110, section 15.6, and RFC 6585, section 4).
[[nodiscard]] bool isWorthRetrying(const HTTPResult& result);

/// What "Retry-After" asks for (RFC 9110, section 10.2.3), as a number of seconds or a date: at least 0, at
/// most `longest`. Nothing without the header, when it is neither, and with other statuses than 429 and 503.
///
/// @param longest  at least 0.
[[nodiscard]] std::optional<std::chrono::milliseconds> retryAfter(const HTTPResult& result, TimePoint now,
                                                                  std::chrono::milliseconds longest);

/// How long to wait for the next attempt; nothing when this was the last one. The wait is what the server
/// asks for and, on top of it, a part of the back-off's range, so that many devices do not come back at once.
/// A server that asks for more than the time that is left gets no further attempt.
///
/// @param draw  evenly distributed over [0, 1).
[[nodiscard]] std::optional<std::chrono::milliseconds> decideRetry(const HTTPResult& result,
                                                                   const FailedAttempt& attempt, double draw,
                                                                   const RetryLimits& limits);

}  // namespace tallyd::platform
