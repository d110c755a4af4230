// The books of one session: what its client offered, and the accounts of its backends.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Value.h"
#include "support/Account.h"

namespace tallyd {

/// By the backend's name and kind.
using CountsByBackend = std::map<std::pair<std::string, std::string>, AccountCounts>;

/// What a session counted, and with it everything that its backends did.
struct SessionCounts {
  AccountCounts messages;
  AccountCounts uploads;
  CountsByBackend backends;

  SessionCounts& operator+=(const SessionCounts& other);
  /// "messages", "uploads" and "backends", an array of dictionaries with "name" and "kind".
  [[nodiscard]] platform::Dictionary dictionary() const;
};

/// Opens accounts for backends and follows them beyond the backends' ends.
///
/// An account that nobody but the book holds any more can't change: it is folded into a sum for its backend's
/// name, so that a book is bounded by the backends that exist and the names that storebags have.
/// Threading: any thread.
class SessionBook {
 public:
  SessionBook() = default;  ///< A book that is in no ledger.
  SessionBook(std::uint64_t number, std::shared_ptr<Tap> tap);
  SessionBook(const SessionBook&) = delete;
  SessionBook& operator=(const SessionBook&) = delete;

  /// Who the session is; accounts that are opened later carry it.
  void describe(std::uint32_t sessionID, std::int32_t clientType, std::string_view clientName);

  /// What the client offered as messages: accepted and, at the moment when they are given to the backends,
  /// sent. The records that a session makes itself are not among them.
  [[nodiscard]] Account& messages() { return _messages; }
  [[nodiscard]] Account& uploads() { return _uploads; }  ///< The same for files and log data.
  [[nodiscard]] std::shared_ptr<Account> openAccount(std::string_view backend, std::string_view kind);

  [[nodiscard]] SessionCounts counts() const;
  /// "session", "sessionID", "clientType" and, if there is one, "clientName".
  [[nodiscard]] platform::Dictionary description() const;
  /// Folds what has ended; true when no account is left that may change.
  bool fold();

 private:
  bool foldLocked();

  const std::shared_ptr<Tap> _tap;
  Account _messages;
  Account _uploads;
  mutable std::mutex _mutex;
  AccountOwner _owner;  ///< Without a backend.
  std::vector<std::shared_ptr<Account>> _accounts;
  CountsByBackend _folded;
};

}  // namespace tallyd
