#include "platform/http/RetryPolicy.h"

#include <gtest/gtest.h>

#include <string>

namespace tallyd::platform {
namespace {

using namespace std::chrono_literals;
using std::chrono::milliseconds;

/// 2026-01-15 12:00:00 UTC, a Thursday.
constexpr TimePoint kNoon{1'768'478'400s};

HTTPResult failure(HTTPFailure kind = HTTPFailure::Transfer) {
  HTTPResult result;
  result.error = "connection refused";
  result.failure = kind;
  return result;
}

HTTPResult answer(int status, const std::string& retryAfter = {}) {
  HTTPResult result;
  result.response = HTTPResponse{status, {}};
  if (!retryAfter.empty()) result.response->headers.emplace_back("Retry-After", retryAfter);
  return result;
}

RetryLimits limitsOf(unsigned attempts) {
  RetryLimits limits;
  limits.attempts = attempts;
  return limits;
}

FailedAttempt after(unsigned retries, milliseconds elapsed = 0ms) { return {retries, elapsed, kNoon}; }

TEST(RetryPolicyTest, TriesAgainOnlyWhatMayEndOtherwise) {
  EXPECT_TRUE(isWorthRetrying(failure()));
  EXPECT_FALSE(isWorthRetrying(failure(HTTPFailure::Permanent)));
  EXPECT_FALSE(isWorthRetrying(failure(HTTPFailure::TooMuchWaits)));
  for (const int status : {429, 502, 503, 504}) EXPECT_TRUE(isWorthRetrying(answer(status))) << status;
  for (const int status : {200, 204, 301, 400, 401, 404, 408, 413, 428, 430, 500, 501, 505}) {
    EXPECT_FALSE(isWorthRetrying(answer(status))) << status;
  }
}

TEST(RetryPolicyTest, ReadsRetryAfterAsSeconds) {
  EXPECT_EQ(retryAfter(answer(503, "7"), kNoon, 900s), 7s);
  EXPECT_EQ(retryAfter(answer(429, "0"), kNoon, 900s), 0s);
}

TEST(RetryPolicyTest, ReadsRetryAfterAsADateInEachOfTheFormsThatHTTPHas) {
  for (const char* date :
       {"Thu, 15 Jan 2026 12:01:30 GMT", "Thursday, 15-Jan-26 12:01:30 GMT", "Thu Jan 15 12:01:30 2026"}) {
    EXPECT_EQ(retryAfter(answer(503, date), kNoon, 900s), 90s) << date;
  }
}

TEST(RetryPolicyTest, ClampsWhatTheServerAsksFor) {
  EXPECT_EQ(retryAfter(answer(503, "901"), kNoon, 900s), 900s);
  EXPECT_EQ(retryAfter(answer(503, "9223372036854775807"), kNoon, 900s), 900s);
  EXPECT_EQ(retryAfter(answer(503, "99999999999999999999999999"), kNoon, 900s), 900s);
  EXPECT_EQ(retryAfter(answer(503, "Thu, 15 Jan 2026 11:59:59 GMT"), kNoon, 900s), 0s);
  EXPECT_EQ(retryAfter(answer(503, "Thu, 15 Jan 1970 11:59:59 GMT"), kNoon, 900s), 0s);
  EXPECT_EQ(retryAfter(answer(503, "Fri, 31 Dec 9999 23:59:59 GMT"), kNoon, 900s), 900s);
}

TEST(RetryPolicyTest, ClampsToTheLongestTimeThereIs) {
  for (const char* text : {"9223372036854775807", "9223372036854776", "99999999999999999999999999"}) {
    EXPECT_EQ(retryAfter(answer(503, text), kNoon, milliseconds::max()), milliseconds::max()) << text;
  }
  EXPECT_EQ(retryAfter(answer(503, "9223372036854775"), kNoon, milliseconds::max()), 9'223'372'036'854'775s);
  EXPECT_EQ(retryAfter(answer(503, "Thu, 15 Jan 2026 12:00:01 GMT"), kNoon, milliseconds::max()), 1s);
  EXPECT_EQ(retryAfter(answer(503, "1"), kNoon, 999ms), 999ms);
  EXPECT_EQ(retryAfter(answer(503, "1"), kNoon, 0ms), 0ms);
}

TEST(RetryPolicyTest, IgnoresARetryAfterThatSaysNothing) {
  EXPECT_EQ(retryAfter(answer(503), kNoon, 900s), std::nullopt);
  EXPECT_EQ(retryAfter(failure(), kNoon, 900s), std::nullopt);
  for (const char* text : {"soon", "-5", "1.5", "7 seconds", "Thu, 99 Jan", "-20260115", "20260115.5",
                           "2026-01-15T12:01:30Z", " "}) {
    EXPECT_EQ(retryAfter(answer(503, text), kNoon, 900s), std::nullopt) << text;
  }
}

TEST(RetryPolicyTest, HearsRetryAfterOnlyFromAServerThatIsBusy) {
  for (const int status : {200, 301, 502, 504}) {
    EXPECT_EQ(retryAfter(answer(status, "7"), kNoon, 900s), std::nullopt) << status;
  }
}

TEST(RetryPolicyTest, DrawsTheWaitFromARangeThatDoublesUpToItsBound) {
  const RetryLimits limits = limitsOf(10);
  const auto widest = [&](unsigned retries) { return *decideRetry(failure(), after(retries), 1.0, limits); };
  EXPECT_EQ(widest(0), 2s);
  EXPECT_EQ(widest(1), 4s);
  EXPECT_EQ(widest(2), 8s);
  EXPECT_EQ(widest(7), 256s);
  EXPECT_EQ(widest(8), 300s);
  EXPECT_EQ(widest(9), 300s);
  EXPECT_EQ(decideRetry(failure(), after(3), 0.0, limits), 0s);
  EXPECT_EQ(decideRetry(failure(), after(3), 0.25, limits), 4s);
}

TEST(RetryPolicyTest, AddsTheDrawToWhatTheServerAsksFor) {
  EXPECT_EQ(decideRetry(answer(503, "60"), after(0), 0.5, limitsOf(1)), 61s);
}

TEST(RetryPolicyTest, EndsAfterTheAttemptsThatAreAllowed) {
  EXPECT_EQ(decideRetry(failure(), after(0), 0.5, limitsOf(0)), std::nullopt);
  EXPECT_NE(decideRetry(failure(), after(1), 0.5, limitsOf(2)), std::nullopt);
  EXPECT_EQ(decideRetry(failure(), after(2), 0.5, limitsOf(2)), std::nullopt);
  EXPECT_EQ(decideRetry(answer(404), after(0), 0.5, limitsOf(2)), std::nullopt);
}

TEST(RetryPolicyTest, BeginsNoAttemptAfterTheTotalTime) {
  EXPECT_EQ(decideRetry(failure(), after(0, 899s), 0.5, limitsOf(3)), 1s);
  EXPECT_EQ(decideRetry(failure(), after(0, 899'001ms), 0.5, limitsOf(3)), std::nullopt);
  EXPECT_EQ(decideRetry(failure(), after(0, 901s), 0.0, limitsOf(3)), std::nullopt);
}

TEST(RetryPolicyTest, GivesUpAtOnceWhenTheServerAsksForMoreThanTheTimeThatIsLeft) {
  EXPECT_EQ(decideRetry(answer(503, "600"), after(0, 200s), 0.5, limitsOf(3)), 601s);
  EXPECT_EQ(decideRetry(answer(503, "600"), after(0, 301s), 0.0, limitsOf(3)), std::nullopt);
  EXPECT_EQ(decideRetry(answer(429, "86400"), after(0, 1s), 0.0, limitsOf(3)), std::nullopt);
}

}  // namespace
}  // namespace tallyd::platform
