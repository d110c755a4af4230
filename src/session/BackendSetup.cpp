#include "session/BackendSetup.h"

#include "framework/Tally.h"
#include "framework/TallyKeys.h"
#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "support/DeviceIdentity.h"
#include "support/SessionBook.h"

namespace tallyd {

using platform::asl_log;
using platform::Dictionary;
using platform::LogLevel;

namespace {

/// What all backends of one set are stamped with.
struct Identity {
  std::uint32_t sessionID;
  std::int32_t clientType;
  std::uint16_t clientVersion;
  bool requireUserInfo;
  bool batchEvents;
  const char* deviceID;
  timeval startTimestamp;
  std::optional<std::string> productVersion;
  std::optional<std::string> buildVersion;
  std::optional<std::string> productType;
  bool isInternal;
  std::string reportingVersion;
  std::optional<Dictionary> userInfo;
};

std::int64_t integerOf(const Dictionary& sessionInfo, std::string_view key) {
  return sessionInfo.integer(key).value_or(0);
}

void stamp(TallyBackend& backend, const Identity& identity) {
  backend.setSessionID(identity.sessionID);
  backend.setCompType(identity.clientType);
  backend.setClientVersion(identity.clientVersion);
  backend.setUdid(identity.deviceID);
  backend.setProductVersion(identity.productVersion);
  backend.setBuildVersion(identity.buildVersion);
  backend.setHardwareType(identity.productType);
  backend.setIsInternal(identity.isInternal);
  backend.setRequireUserInfo(identity.requireUserInfo);
  backend.setBatchEvents(identity.batchEvents);
  backend.setUserInfoDict(identity.userInfo);
  backend.setSelfVersion(identity.reportingVersion);
  backend.setStartTimestamp(identity.startTimestamp);
}

std::optional<Dictionary> profileOf(const platform::Platform& platform, const Dictionary::Entry& entry) {
  if (const Dictionary* profile = entry.value.dictionary()) return *profile;
  asl_log(platform.log, LogLevel::Error, "Storebag entry {} is not a dictionary", entry.key);
  return std::nullopt;
}

}  // namespace

std::optional<BackendSet> createBackendsFromStorebag(const platform::Platform& platform,
                                                     const std::optional<Dictionary>& storebag,
                                                     const std::optional<Dictionary>& sessionInfo,
                                                     const std::optional<Dictionary>& userInfo,
                                                     const char* deviceID, const BackendFactory& newBackend,
                                                     SessionBook* book) {
  if (!storebag) {
    asl_log(platform.log, LogLevel::Critical, "Attempted to create backends with nil storebag");
    return std::nullopt;
  }
  if (!sessionInfo) {
    asl_log(platform.log, LogLevel::Critical, "Attempted to create backends with nil session info");
    return std::nullopt;
  }
  const timeval startTimestamp = platform.clock.timeOfDay();
  const auto productFamily = deviceName(platform);
  const Identity identity{
      .sessionID = static_cast<std::uint32_t>(integerOf(*sessionInfo, kTallySessionInfoSessionID)),
      .clientType = static_cast<std::int32_t>(integerOf(*sessionInfo, kTallySessionInfoClientType)),
      .clientVersion = static_cast<std::uint16_t>(integerOf(*sessionInfo, kTallySessionInfoClientVersion)),
      .requireUserInfo = sessionInfo->boolean(kTallySessionInfoRequireUserInfo),
      .batchEvents = sessionInfo->boolean(kTallySessionInfoBatchEvent),
      .deviceID = deviceID,
      .startTimestamp = startTimestamp,
      .productVersion = deviceProductVersion(platform),
      .buildVersion = deviceBuildVersion(platform),
      .productType = deviceProductType(platform),
      .isInternal = isInternalBuild(platform),
      .reportingVersion = Tally(platform).bundleVersion().value_or(std::string(kDefaultReportingVersion)),
      .userInfo = userInfo};
  BackendSet backends;
  for (const Dictionary::Entry& entry : *storebag) {
    auto backend =
        newBackend(platform, entry.key, profileOf(platform, entry), productFamily, identity.clientType);
    if (!backend) continue;
    stamp(*backend, identity);
    if (book) backend->setAccount(book->openAccount(entry.key, backend->kind()));
    backends.emplace(entry.key, std::move(backend));
  }
  return backends;
}

}  // namespace tallyd
