// The framework's door to the system log.
#pragma once

#include <string_view>

#include "platform/Log.h"

namespace tallyd {

/// The logging class of the client framework: opens the log that all later lines of the process go through.
class TallyLogging {
 public:
  explicit TallyLogging(platform::Log& asl) : _asl(asl) {}

  void startLogging(std::string_view name, std::string_view facility) { _asl.open(name, facility); }
  [[nodiscard]] platform::Log& asl() const { return _asl; }

 private:
  platform::Log& _asl;
};

}  // namespace tallyd
