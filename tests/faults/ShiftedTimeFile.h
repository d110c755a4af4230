// The file through which a test shifts a program's time of day: one number, mapped by both.
#pragma once

#include <atomic>
#include <cstdint>

namespace tallyd::test {

/// The environment variable that names the file to the preloaded library.
inline constexpr const char* kShiftedTimeVariable = "TALLYD_TEST_SHIFTED_TIME";

/// All that the file holds: the seconds by which the program's time of day is ahead of the system's.
using TimeShift = std::atomic<std::int64_t>;
static_assert(TimeShift::is_always_lock_free, "two processes share it");

}  // namespace tallyd::test
