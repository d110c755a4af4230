// What the command line says of a session, as the dictionaries that the daemon takes.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/Value.h"

namespace tallyd::tallyctl {

struct SessionOptions {
  std::int32_t clientType = 5;
  std::optional<std::uint32_t> sessionID;  ///< Random when not given.
  std::optional<std::uint16_t> clientVersion;
  bool requireUserInfo = false;
  bool batchEvent = false;
  std::optional<std::string> clientName;
  std::optional<std::string> serviceName;
  platform::Dictionary furtherUserInfo;
  std::vector<std::string> frameworks;
};

/// A number from 1 to 2^31 - 1, so that it reads the same as a signed one.
[[nodiscard]] std::uint32_t randomSessionID();

[[nodiscard]] platform::Dictionary sessionInfo(const SessionOptions& options, std::uint32_t sessionID);

/// Nothing when no option says anything of the user. The named options win over further keys.
[[nodiscard]] std::optional<platform::Dictionary> userInfo(const SessionOptions& options);

}  // namespace tallyd::tallyctl
