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

/// All three forms of a date begin with the day's name (RFC 9110, section 5.6.7). libcurl takes many more,
/// such as the digits of "-20260115".
bool beginsLikeADate(std::string_view text) {
  return !text.empty() && ((text[0] >= 'A' && text[0] <= 'Z') || (text[0] >= 'a' && text[0] <= 'z'));
}

/// A number that does not fit counts as the longest time.
seconds secondsOf(std::string_view digits) {
  std::int64_t number = 0;
  const auto parsed = std::from_chars(digits.data(), digits.data() + digits.size(), number);
  return parsed.ec == std::errc() ? seconds(number) : seconds::max();
}

/// Until the server's date, which is negative when that has passed. Years that no TimePoint holds are no
/// trouble in whole seconds.
std::optional<seconds> secondsUntil(const std::string& date, TimePoint now) {
  if (!beginsLikeADate(date)) return std::nullopt;
  const std::time_t time = curl_getdate(date.c_str(), nullptr);
  if (time == -1) return std::nullopt;
  return seconds(time) - std::chrono::floor<seconds>(now.time_since_epoch());
}

/// Compares in whole seconds: not each of them can be said in milliseconds.
milliseconds clamped(seconds wait, milliseconds longest) {
  if (wait < seconds(0)) return milliseconds(0);
  return wait > std::chrono::floor<seconds>(longest) ? longest : wait;
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
  const auto wait = isNumber(*header) ? secondsOf(*header) : secondsUntil(*header, now);
  if (!wait) return std::nullopt;
  return clamped(*wait, longest);
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
