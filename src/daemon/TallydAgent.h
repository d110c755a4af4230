// Accepts connections, keeps the live sessions, and answers what sessions ask.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/Fatal.h"
#include "platform/IPC.h"
#include "session/BackendSetup.h"
#include "session/TallydSessionDelegate.h"
#include "storebag/StorebagCache.h"
#include "support/Consent.h"
#include "support/Ledger.h"
#include "support/MessageLog.h"

namespace tallyd {

/// What an operator may ask for; by default nothing.
struct AgentOptions {
  platform::FatalFailures fatalFailures = platform::FatalFailures::EndProcess;
  ConsentChecks consentChecks = ConsentChecks::AtStart;
};

/// One per process, for its whole life.
///
/// Sessions enter the list when their connection is accepted and leave it at its invalidation. Sessions of
/// one client and service name form a group, in the order in which they joined; groups stay when they are
/// empty.
/// Threading: any thread. One lock guards list and groups; under it no session is created or destroyed, and
/// of a session only its hierarchy and combined ID are read, each under the session's own lock.
class TallydAgent final : public platform::ListenerDelegate, public TallydSessionDelegate {
 public:
  /// Borrows the platform. `ledger` gets a book for every session.
  explicit TallydAgent(const platform::Platform& platform,
                       std::shared_ptr<Ledger> ledger = std::make_shared<Ledger>(),
                       const AgentOptions& options = {});
  ~TallydAgent() override;

  /// False when there is no memory for a session; nothing is kept of the connection then.
  bool shouldAcceptNewConnection(const std::shared_ptr<platform::ServiceConnection>& connection) override;

  /// Ends every connection, and with it its session, as if the client had left. Returns at once.
  void endSessions();

  std::optional<platform::Dictionary> storebagForSession(const TallydSession& session) override;
  std::optional<std::string> storebagVersionForSession(const TallydSession& session) override;
  std::optional<std::string> parentSessionIDStringForSession(const TallydSession& session) override;
  void userInfoUpdatedForSession(TallydSession& session) override;
  /// Fetches the client type's storebag once, on the calling thread, and keeps what came of it.
  void fetchAndCacheStorebag(std::int32_t clientType) { _cachedStorebags.fetchAndCacheStorebag(clientType); }
  [[nodiscard]] std::string description() const override;

 private:
  using Sessions = std::vector<std::shared_ptr<TallydSession>>;

  /// What a look into a session's group found.
  struct Group {
    enum class Lookup { Empty, NotAMember, NoParent, Found } lookup;
    std::string parentID;
  };

  std::pair<std::size_t, std::size_t> counts();  ///< Of sessions and of groups.
  Group findParent(const TallydSession& session, const std::string& key, std::int64_t parentHierarchy);
  void serve(const std::shared_ptr<TallydSession>& session,
             const std::shared_ptr<platform::ServiceConnection>& connection);
  void forget(const TallydSession& session);
  void connectionInvalidated(const std::shared_ptr<TallydSession>& session);

  const platform::Platform& _platform;
  const std::shared_ptr<Ledger> _ledger;
  const BackendFactory _newBackend;
  MessageLog _messageLog;
  StorebagCache _cachedStorebags;
  std::mutex _mutex;
  Sessions _sessionList;
  std::unordered_map<const TallydSession*, std::weak_ptr<platform::ServiceConnection>> _connections;
  std::map<std::string, Sessions> _correlatedSessions;
  /// The group that a session is in, so that leaving it takes no walk through all of them.
  std::unordered_map<const TallydSession*, std::string> _groupOfSession;
};

/// "CLIENT:SERVICE" of a user info's names in lower case, each empty when missing.
[[nodiscard]] std::string correlationKeyForUserInfo(const std::optional<platform::Dictionary>& userInfo);

}  // namespace tallyd
