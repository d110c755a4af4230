#include "tallyctl/SessionInfo.h"

#include <limits>
#include <random>

#include "framework/TallyKeys.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

std::uint32_t randomSessionID() {
  std::random_device source;
  return std::uniform_int_distribution<std::uint32_t>(1, std::numeric_limits<std::int32_t>::max())(source);
}

Dictionary sessionInfo(const SessionOptions& options, std::uint32_t sessionID) {
  Dictionary info{{std::string(kTallySessionInfoSessionID), Value(sessionID)},
                  {std::string(kTallySessionInfoClientType), Value(options.clientType)}};
  if (options.clientVersion) info.set(kTallySessionInfoClientVersion, unsigned{*options.clientVersion});
  if (options.requireUserInfo) info.set(kTallySessionInfoRequireUserInfo, true);
  if (options.batchEvent) info.set(kTallySessionInfoBatchEvent, true);
  return info;
}

std::optional<Dictionary> userInfo(const SessionOptions& options) {
  if (!options.clientName && !options.serviceName && options.furtherUserInfo.empty()) return std::nullopt;
  Dictionary info = options.furtherUserInfo;
  if (options.clientName) info.set(kTallyUserInfoClientName, *options.clientName);
  if (options.serviceName) info.set(kTallyUserInfoServiceName, *options.serviceName);
  return info;
}

}  // namespace tallyd::tallyctl
