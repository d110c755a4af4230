// What a session knows of its user: acceptance, reporting states, the combined session ID.

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "session/TallydSession.h"
#include "session/TallydSessionDelegate.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

void TallydSession::receivedUserInfo(const Info& userInfo) {
  if (!userInfo) {
    asl_log(_platform.log, LogLevel::Debug, "Received nil user info for session {}", sessionID());
    describeInBook();
    updateReportingStates();
    return;
  }
  if (userInfoChanged(*userInfo)) {
    _userInfo = userInfo;
    _sessionDelegate.userInfoUpdatedForSession(*this);
  }
  describeInBook();
  updateReportingStates();
  const auto parent = _sessionDelegate.parentSessionIDStringForSession(*this);
  const std::string own = combinedSessionIDString();
  // The prefix goes in front of the current value: it grows with every call that finds a parent.
  const std::string combined = parent ? *parent + "." + own : own;
  setCombinedSessionIDString(combined);
  asl_log(_platform.log, LogLevel::Debug, "Setting combined session ID '{}' for backends", combined);
  if (const auto backends = _backends.copy()) {
    for (const auto& [name, backend] : *backends) backend->setCorrelatedSessionID(combined);
  }
}

bool TallydSession::userInfoChanged(const Dictionary& userInfo) const {
  if (!_userInfo) return true;
  const auto differs = [&](std::string_view key) {
    const auto given = userInfo.string(key);
    return !given || given != _userInfo->string(key);
  };
  return differs(kTallyUserInfoClientName) || differs(kTallyUserInfoServiceName);
}

void TallydSession::updateReportingStates() {
  const auto backends = _backends.copy();
  if (!backends) return;
  for (const auto& [name, backend] : *backends) {
    backend->setUserInfoDict(_userInfo);
    backend->updateState();
  }
}

std::optional<TallydSession::Names> TallydSession::fetchReportingStates() const {
  const auto backends = _backends.copy();
  if (!backends) return std::nullopt;
  Names names;
  for (const auto& [name, backend] : *backends) {
    if (backend->state() == ReportingStateOn) names.push_back(name);
  }
  return names;
}

std::int32_t TallydSession::getSessionHierarchy() const {
  // Under the lock, not on a copy: the asker may hold a lock of its own, under which no backend should end.
  return _backends.withLock([](const SharedBackends& backends) -> std::int32_t {
    if (!backends) return 0;
    const auto found = backends->find(kTallyBackendHTTPPost);
    return found == backends->end() ? 0 : found->second->hierarchy();
  });
}

void TallydSession::fetchDisplayURL(const Reply<std::string>& reply) {
  asl_log(_platform.log, LogLevel::Debug, "Fetching display URL for session {}", sessionID());
  const auto backends = _backends.copy();
  if (backends) {
    const auto dashboard = backends->find(kTallyBackendDashboard);
    if (dashboard != backends->end() && dashboard->second->displayURL()) {
      reply(fmt::format("{}?sequences={}&override=yes", *dashboard->second->displayURL(),
                        static_cast<std::int32_t>(sessionID())));
      return;
    }
  }
  reply("URL not available");
}

}  // namespace tallyd
