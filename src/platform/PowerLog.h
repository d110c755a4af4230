// The system's power log.
#pragma once

#include <cstdint>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::platform {

/// Takes registered events. Threading: any thread; a call may block on the disk.
class PowerLog {
 public:
  virtual ~PowerLog() = default;

  /// Records one event under its registered number and name. Throws std::system_error when it is not
  /// recorded, which the log has told of itself.
  virtual void WBLogRegisteredEvent(std::int32_t number, std::string_view name, const Dictionary& record) = 0;
};

}  // namespace tallyd::platform
