// The failures that by design end the process.
#pragma once

#include <cstdlib>

#include "platform/Log.h"

namespace tallyd::platform {

/// What such a failure costs.
enum class FatalFailures {
  EndProcess,   ///< The process.
  FailRequest,  ///< Only the request that met it: the caller fails it, like any other failure would.
};

/// Logs one critical line that names the reason and aborts, unless only the request is to fail; then it
/// returns.
template <class... Arguments>
void fatalFailure(Log& log, FatalFailures failures, fmt::format_string<Arguments...> reason,
                  Arguments&&... arguments) {
  asl_log(log, LogLevel::Critical, reason, std::forward<Arguments>(arguments)...);
  if (failures == FatalFailures::EndProcess) std::abort();
}

}  // namespace tallyd::platform
