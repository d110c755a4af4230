// The failures that end the process.
#pragma once

#include <cstdlib>

#include "platform/Log.h"

namespace tallyd::platform {

/// Logs one critical line that names the reason and aborts.
template <class... Arguments>
[[noreturn]] void endProcess(Log& log, fmt::format_string<Arguments...> reason, Arguments&&... arguments) {
  asl_log(log, LogLevel::Critical, reason, std::forward<Arguments>(arguments)...);
  std::abort();
}

}  // namespace tallyd::platform
