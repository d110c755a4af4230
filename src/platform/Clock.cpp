#include "platform/Clock.h"

namespace tallyd::platform {

using std::chrono::duration_cast;
using std::chrono::microseconds;

timeval Clock::timeOfDay() const {
  const auto time = now().time_since_epoch();
  const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
  return {static_cast<time_t>(seconds.count()),
          static_cast<suseconds_t>(duration_cast<microseconds>(time - seconds).count())};
}

double secondsSince1970(TimePoint time) {
  return std::chrono::duration<double>(time.time_since_epoch()).count();
}

Date dateFromTimePoint(TimePoint time) { return {secondsSince1970(time)}; }

TimePoint timePointFromDate(Date date) {
  return TimePoint(duration_cast<TimePoint::duration>(std::chrono::duration<double>(date.secondsSince1970)));
}

}  // namespace tallyd::platform
