#include "platform/http/RetryPolicy.h"

#include <curl/curl.h>

#include <algorithm>
#include <charconv>
#include <string>

namespace tallyd::platform {

namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr int kTooManyRequests = 429;
constexpr int kBadGateway = 502;
constexpr int kServiceUnavailable = 503;
constexpr int kGatewayTimeout = 504;

bool isNumber(std::string_view text) {
  return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

/// A number that does not fit counts as the longest time.
milliseconds secondsOf(std::string_view digits, milliseconds longest) {
  std::int64_t number = 0;
  const auto parsed = std::from_chars(digits.data(), digits.data() + digits.size(), number);
  const auto most = std::chrono::ceil<seconds>(longest).count();
  if (parsed.ec != std::errc()) return longest;
  return std::min<milliseconds>(seconds(std::min<std::int64_t>(number, most)), longest);
}

milliseconds backoffRange(unsigned retries, const RetryLimits& limits) {
  milliseconds range = limits.firstBackoff;
  for (unsigned i = 0; i < retries && range < limits.longestBackoff; ++i) range *= 2;
  return std::min(range, limits.longestBackoff);
}

}  // namespace

bool isWorthRetrying(const HTTPResult& result) {
  if (result.error) return result.failure == HTTPFailure::Transfer;
  if (!result.response) return false;
  switch (result.response->status) {
    case kTooManyRequests:
    case kBadGateway:
    case kServiceUnavailable:
    case kGatewayTimeout:
      return true;
    default:
      return false;
  }
}

std::optional<milliseconds> retryAfter(const HTTPResult& result, TimePoint now, milliseconds longest) {
  if (!result.response) return std::nullopt;
  const int status = result.response->status;
  if (status != kTooManyRequests && status != kServiceUnavailable) return std::nullopt;
  const auto header = result.response->header("Retry-After");
  if (!header) return std::nullopt;
  if (isNumber(*header)) return secondsOf(*header, longest);
  const std::time_t date = curl_getdate(header->c_str(), nullptr);
  if (date == -1) return std::nullopt;
  // Seconds, which no date overflows.
  const auto wait = seconds(date) - std::chrono::floor<seconds>(now.time_since_epoch());
  return std::clamp<milliseconds>(std::clamp<seconds>(wait, seconds(0), std::chrono::ceil<seconds>(longest)),
                                  milliseconds(0), longest);
}

std::optional<milliseconds> decideRetry(const HTTPResult& result, const FailedAttempt& attempt, double draw,
                                        const RetryLimits& limits) {
  if (attempt.retries >= limits.attempts || !isWorthRetrying(result)) return std::nullopt;
  const auto asked = retryAfter(result, attempt.now, limits.totalTime).value_or(milliseconds(0));
  const auto range = backoffRange(attempt.retries, limits);
  const auto wait =
      asked + milliseconds(static_cast<std::int64_t>(draw * static_cast<double>(range.count())));
  if (attempt.elapsed + wait > limits.totalTime) return std::nullopt;
  return wait;
}

}  // namespace tallyd::platform
