#include "daemon/TallydAgent.h"

#include <algorithm>
#include <new>

#include "framework/ClientSessionInterface.h"
#include "framework/TallyKeys.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/text/UnicodeText.h"
#include "session/ClientSessionExport.h"
#include "session/TallydSession.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

std::int32_t clientTypeOf(const TallydSession& session) {
  const auto& info = session.sessionInfo();
  return info ? static_cast<std::int32_t>(info->integer(kTallySessionInfoClientType).value_or(0)) : 0;
}

bool holds(const std::vector<std::shared_ptr<TallydSession>>& sessions, const TallydSession& session) {
  return std::any_of(sessions.begin(), sessions.end(),
                     [&](const auto& held) { return held.get() == &session; });
}

void removeFrom(std::vector<std::shared_ptr<TallydSession>>& sessions, const TallydSession& session) {
  std::erase_if(sessions, [&](const auto& held) { return held.get() == &session; });
}

BackendFactory backendFactory(ConsentChecks consentChecks) {
  if (consentChecks == ConsentChecks::AtStart) return TallyBackend::newBackendWithName;
  return [](const auto&... entry) {
    auto backend = TallyBackend::newBackendWithName(entry...);
    if (backend) backend->recheckConsent();
    return backend;
  };
}

}  // namespace

std::string correlationKeyForUserInfo(const std::optional<platform::Dictionary>& userInfo) {
  const auto name = [&](std::string_view key) {
    return platform::lowercased(userInfo ? userInfo->string(key).value_or("") : "");
  };
  return name(kTallyUserInfoClientName) + ":" + name(kTallyUserInfoServiceName);
}

TallydAgent::TallydAgent(const platform::Platform& platform, std::shared_ptr<Ledger> ledger,
                         const AgentOptions& options)
    : _platform(platform),
      _ledger(std::move(ledger)),
      _newBackend(backendFactory(options.consentChecks)),
      _messageLog(platform),
      _cachedStorebags(platform, options.fatalFailures) {}

TallydAgent::~TallydAgent() = default;

bool TallydAgent::shouldAcceptNewConnection(const std::shared_ptr<platform::ServiceConnection>& connection) {
  const auto [sessions, groups] = counts();
  asl_log(_platform.log, LogLevel::Debug, "Accepting new XPC connection {}, {}({}) connections.",
          connection->description(), sessions, groups);
  _ledger->connectionAccepted();
  std::shared_ptr<TallydSession> session;
  try {
    session =
        std::make_shared<TallydSession>(*this, _platform, _messageLog, _newBackend, _ledger->openBook());
    serve(session, connection);
    return true;
  } catch (const std::bad_alloc&) {
    asl_log(_platform.log, LogLevel::Critical, "No memory for a new connection");
    if (session) forget(*session);
    _ledger->connectionEnded();
    return false;
  }
}

void TallydAgent::serve(const std::shared_ptr<TallydSession>& session,
                        const std::shared_ptr<platform::ServiceConnection>& connection) {
  connection->setExportedInterface(clientSessionInterface());
  connection->setExportedObject(std::make_shared<ClientSessionExport>(session, _platform.sandbox));
  {
    const std::lock_guard lock(_mutex);
    _sessionList.push_back(session);
    _connections.emplace(session.get(), connection);
  }
  connection->setInterruptionHandler([this, session] {
    asl_log(_platform.log, LogLevel::Debug, "XPC connection to {} was interrupted", session->description());
  });
  connection->setInvalidationHandler([this, session] { connectionInvalidated(session); });
  connection->resume();
}

/// Takes no memory. The caller holds the session: no reference that goes here is the last.
void TallydAgent::forget(const TallydSession& session) {
  const std::lock_guard lock(_mutex);
  removeFrom(_sessionList, session);
  _connections.erase(&session);
  const auto joined = _groupOfSession.find(&session);
  if (joined == _groupOfSession.end()) return;
  const auto group = _correlatedSessions.find(joined->second);
  if (group != _correlatedSessions.end()) removeFrom(group->second, session);
  _groupOfSession.erase(joined);
}

void TallydAgent::endSessions() {
  std::vector<std::shared_ptr<platform::ServiceConnection>> connections;
  {
    const std::lock_guard lock(_mutex);
    for (const auto& [session, connection] : _connections) connections.push_back(connection.lock());
  }
  for (const auto& connection : connections) {
    if (connection) connection->finish();
  }
}

std::pair<std::size_t, std::size_t> TallydAgent::counts() {
  const std::lock_guard lock(_mutex);
  return {_sessionList.size(), _correlatedSessions.size()};
}

/// Nothing stays listed when there is no memory for the line.
void TallydAgent::connectionInvalidated(const std::shared_ptr<TallydSession>& session) {
  forget(*session);
  _ledger->connectionEnded();
  asl_log(_platform.log, LogLevel::Debug, "XPC connection to {} was invalidated", session->description());
}

std::optional<platform::Dictionary> TallydAgent::storebagForSession(const TallydSession& session) {
  return _cachedStorebags.storebag(session.sessionID(), clientTypeOf(session));
}

std::optional<std::string> TallydAgent::storebagVersionForSession(const TallydSession& session) {
  return _cachedStorebags.version(clientTypeOf(session));
}

void TallydAgent::userInfoUpdatedForSession(TallydSession& session) {
  if (!session.userInfo()) {
    asl_log(_platform.log, LogLevel::Critical, "{} No user info found for session {}",
            "-[TallydAgent userInfoUpdatedForSession:]", session.sessionID());
    return;
  }
  const std::string key = correlationKeyForUserInfo(session.userInfo());
  asl_log(_platform.log, LogLevel::Debug, "Adding session {} to list for userInfoKey {}", session.sessionID(),
          key);
  const std::lock_guard lock(_mutex);
  std::string& joined = _groupOfSession[&session];
  if (!joined.empty()) removeFrom(_correlatedSessions[joined], session);
  _correlatedSessions[key].push_back(session.shared_from_this());
  joined = key;
}

std::optional<std::string> TallydAgent::parentSessionIDStringForSession(const TallydSession& session) {
  const std::int32_t hierarchy = session.getSessionHierarchy();
  if (hierarchy == 0) return std::nullopt;
  const std::string key = correlationKeyForUserInfo(session.userInfo());
  asl_log(_platform.log, LogLevel::Debug, "Checking userInfoKey '{}' for session {}", key,
          session.sessionID());

  switch (Group group = findParent(session, key, std::int64_t{hierarchy} - 1); group.lookup) {
    case Group::Lookup::Empty:
      asl_log(_platform.log, LogLevel::Critical, "ERROR: No sessions found for user info key {}", key);
      return std::nullopt;
    case Group::Lookup::NotAMember:
      asl_log(_platform.log, LogLevel::Critical, "ERROR: Session {} not found for user info key {}",
              session.sessionID(), key);
      return std::nullopt;
    case Group::Lookup::NoParent:
      asl_log(_platform.log, LogLevel::Debug,
              "ERROR: Could not find parent for session {} with user info key {}", session.sessionID(), key);
      return std::nullopt;
    case Group::Lookup::Found:
      return std::move(group.parentID);
  }
  return std::nullopt;
}

TallydAgent::Group TallydAgent::findParent(const TallydSession& session, const std::string& key,
                                           std::int64_t parentHierarchy) {
  const std::lock_guard lock(_mutex);
  const auto found = _correlatedSessions.find(key);
  if (found == _correlatedSessions.end() || found->second.empty()) return {Group::Lookup::Empty, {}};
  const Sessions& group = found->second;
  if (!holds(group, session)) return {Group::Lookup::NotAMember, {}};
  const auto parent = std::find_if(group.begin(), group.end(), [&](const auto& candidate) {
    return candidate->getSessionHierarchy() == parentHierarchy;
  });
  if (parent == group.end()) return {Group::Lookup::NoParent, {}};
  return {Group::Lookup::Found, (*parent)->combinedSessionIDString()};
}

std::string TallydAgent::description() const {
  return fmt::format("<TallydAgent: {}>", fmt::ptr(static_cast<const void*>(this)));
}

}  // namespace tallyd
