// The headers of a server's answer: joined by name, and among them the storebag's age and when a server wants
// to be asked again.

#include <algorithm>
#include <chrono>
#include <limits>
#include <optional>
#include <string>
#include <utility>

#include "FuzzTarget.h"
#include "platform/HTTPClient.h"
#include "platform/Value.h"
#include "platform/http/RetryPolicy.h"
#include "storebag/StorebagRetrieval.h"

namespace tallyd::fuzz {
namespace {

using platform::HTTPResponse;
using platform::HTTPResult;
using platform::retryAfter;
using platform::TimePoint;
using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr std::string_view kName = "Cache-Control";

std::string asciiLowercased(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
  return result;
}

HTTPResponse responseFrom(Input& input) {
  HTTPResponse response;
  response.status = 200;
  while (!input.isEmpty()) {
    const auto line = input.takeLine();
    const auto colon = std::min(line.find(':'), line.size());
    const auto value = line.substr(std::min(colon + 1, line.size()));
    response.headers.emplace_back(line.substr(0, colon),
                                  value.substr(std::min(value.find_first_not_of(' '), value.size())));
  }
  return response;
}

/// The first component that is just "max-age", said in another way than the reader says it.
void checkAge(std::string_view header) {
  const CacheAge age = cacheAgeFromHeader(header);
  std::string separated(header);
  std::replace(separated.begin(), separated.end(), ' ', '=');
  const auto found = ("=" + separated + "=").find("=max-age=");
  if (found == std::string::npos) {
    FUZZ_CHECK(!age.endsInMaxAge && age.maxAgeSeconds == 86'400);
    return;
  }
  const bool isLast = found + 7 == separated.size();
  FUZZ_CHECK(age.endsInMaxAge == isLast);
  if (isLast) return;
  const auto number = separated.substr(found + 8);
  const auto wanted = std::clamp<std::int64_t>(platform::leadingInteger(number.substr(0, number.find('='))),
                                               std::numeric_limits<std::int32_t>::min(),
                                               std::numeric_limits<std::int32_t>::max());
  FUZZ_CHECK(age.maxAgeSeconds == wanted);
}

HTTPResult resultWith(int status, HTTPResponse response) {
  response.status = status;
  HTTPResult result;
  result.response = std::move(response);
  return result;
}

constexpr TimePoint kNoon{seconds(1'768'478'400)};  // 2026-01-15 12:00:00 UTC

bool isDigit(char c) { return c >= '0' && c <= '9'; }

/// The time that a date of the form "Thu, 15 Jan 2026 12:01:30 GMT" says, if it is one, whatever its day of
/// the week.
std::optional<std::chrono::sys_seconds> timeOfDate(std::string_view text) {
  constexpr std::string_view kForm = "Thu, 00 Jan 0000 00:00:00 GMT";
  constexpr std::string_view kDays = "Mon Tue Wed Thu Fri Sat Sun";
  constexpr std::string_view kMonths = "Jan Feb Mar Apr May Jun Jul Aug Sep Oct Nov Dec";
  if (text.size() != kForm.size()) return std::nullopt;
  std::string form(text);
  for (char& c : form) c = isDigit(c) ? '0' : c;
  form.replace(0, 3, kForm, 0, 3).replace(8, 3, kForm, 8, 3);
  const auto month = kMonths.find(text.substr(8, 3));
  const auto day = kDays.find(text.substr(0, 3));
  constexpr std::size_t kNameAndBlank = 4;
  if (form != kForm || month % kNameAndBlank != 0 || day % kNameAndBlank != 0) return std::nullopt;
  const auto number = [&](std::size_t place, std::size_t digits) {
    return static_cast<int>(platform::leadingInteger(text.substr(place, digits)));
  };
  const std::chrono::year_month_day date(std::chrono::year(number(12, 4)),
                                         std::chrono::month(static_cast<unsigned>(month / kNameAndBlank) + 1),
                                         std::chrono::day(static_cast<unsigned>(number(5, 2))));
  const int hour = number(17, 2);
  const int minute = number(20, 2);
  const int second = number(23, 2);
  // libcurl knows no date before 1583, the calendar's first whole year.
  if (!date.ok() || int{date.year()} < 1583 || hour > 23 || minute > 59 || second > 59) return std::nullopt;
  return std::chrono::sys_days(date) + std::chrono::hours(hour) + std::chrono::minutes(minute) +
         seconds(second);
}

/// What a busy server asks for at noon, said in another way than the reader says it.
void checkWhatIsAskedFor(const HTTPResult& busy, std::string_view text) {
  constexpr seconds kLongest{900};
  const auto wait = retryAfter(busy, kNoon, kLongest);
  if (const auto time = timeOfDate(text)) {
    FUZZ_CHECK(wait == std::clamp(time->time_since_epoch() - seconds(1'768'478'400), seconds(0), kLongest));
    return;
  }
  const bool isNumber = !text.empty() && std::all_of(text.begin(), text.end(), isDigit);
  if (!isNumber) {
    const std::string first = asciiLowercased(text.substr(0, 1));
    FUZZ_CHECK(!wait || (first >= "a" && first <= "z"));  // Else not even a date.
    return;
  }
  const auto digits = text.substr(std::min(text.find_first_not_of('0'), text.size()));
  const auto wanted = digits.size() > 3 ? kLongest : seconds(platform::leadingInteger(digits));
  FUZZ_CHECK(wait == std::min(wanted, kLongest));
}

/// At every time of day a wait is neither negative nor longer than it may be, and the bound changes nothing
/// else.
void checkBounds(const HTTPResult& busy) {
  for (const TimePoint now : {kNoon, TimePoint(), TimePoint::min(), TimePoint::max()}) {
    const auto asked = retryAfter(busy, now, milliseconds::max());
    FUZZ_CHECK(asked.value_or(milliseconds(0)) >= milliseconds(0));
    FUZZ_CHECK(retryAfter(busy, now, milliseconds::max()) == asked);
    for (const auto longest : {milliseconds(0), milliseconds(1), milliseconds(999), milliseconds(900'000)}) {
      const auto wait = retryAfter(busy, now, longest);
      FUZZ_CHECK(wait.has_value() == asked.has_value());
      FUZZ_CHECK(!wait || *wait == std::min(*asked, longest));
    }
  }
}

/// The next attempt comes when the server asks for it or soon after, and never too late.
void checkAttempt(const HTTPResult& busy) {
  const platform::RetryLimits limits{.attempts = 1};
  const platform::FailedAttempt attempt{.retries = 0, .elapsed = seconds(300), .now = kNoon};
  const auto asked = retryAfter(busy, kNoon, limits.totalTime).value_or(milliseconds(0));
  for (const double draw : {0.0, 0.5}) {
    const auto latest = asked + milliseconds(static_cast<std::int64_t>(draw * 2'000));
    const bool isInTime = attempt.elapsed + latest <= limits.totalTime;
    FUZZ_CHECK(decideRetry(busy, attempt, draw, limits) == (isInTime ? std::optional(latest) : std::nullopt));
  }
}

void checkRetryAfter(const HTTPResponse& response) {
  const HTTPResult busy = resultWith(503, response);
  checkBounds(busy);
  checkAttempt(busy);
  const auto text = response.header("Retry-After");
  if (text) checkWhatIsAskedFor(busy, *text);
  FUZZ_CHECK(text || !retryAfter(busy, kNoon, milliseconds::max()));
  FUZZ_CHECK(retryAfter(resultWith(429, response), kNoon, milliseconds::max()) ==
             retryAfter(busy, kNoon, milliseconds::max()));
  FUZZ_CHECK(!retryAfter(resultWith(502, response), kNoon, milliseconds::max()));
}

}  // namespace
}  // namespace tallyd::fuzz

/// Lines "NAME: VALUE".
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const HTTPResponse response = responseFrom(input);
  std::optional<std::string> joined;
  for (const auto& [name, value] : response.headers) {
    if (asciiLowercased(name) != asciiLowercased(kName)) continue;
    joined = joined ? *joined + ", " + value : value;
  }
  FUZZ_CHECK(response.header(kName) == joined);
  FUZZ_CHECK(response.header(asciiLowercased(kName)) == joined);
  if (joined) checkAge(*joined);
  checkRetryAfter(response);
  FUZZ_CHECK(tallyd::cacheAgeFromHeader(std::nullopt).maxAgeSeconds == 0);
  return 0;
}
