#include "platform/system/SystemClock.h"

namespace tallyd::platform {

TimePoint SystemClock::now() const { return std::chrono::system_clock::now(); }

}  // namespace tallyd::platform
