#include "support/SessionBook.h"

namespace tallyd {

using platform::Array;
using platform::Dictionary;

SessionCounts& SessionCounts::operator+=(const SessionCounts& other) {
  messages += other.messages;
  uploads += other.uploads;
  for (const auto& [backend, counts] : other.backends) backends[backend] += counts;
  return *this;
}

Dictionary SessionCounts::dictionary() const {
  Array rows;
  for (const auto& [backend, counts] : backends) {
    Dictionary row = counts.dictionary();
    row.set("name", backend.first);
    row.set("kind", backend.second);
    rows.append(row);
  }
  return {{"messages", messages.dictionary()}, {"uploads", uploads.dictionary()}, {"backends", rows}};
}

SessionBook::SessionBook(std::uint64_t number, std::shared_ptr<Tap> tap)
    : _tap(std::move(tap)),
      _messages({.session = number}, _tap),
      _uploads({.session = number}, _tap),
      _owner{.session = number} {}

void SessionBook::describe(std::uint32_t sessionID, std::int32_t clientType, std::string_view clientName) {
  const std::lock_guard lock(_mutex);
  _owner.sessionID = sessionID;
  _owner.clientType = clientType;
  _owner.clientName = clientName;
}

std::shared_ptr<Account> SessionBook::openAccount(std::string_view backend, std::string_view kind) {
  const std::lock_guard lock(_mutex);
  foldLocked();
  AccountOwner owner = _owner;
  owner.backend = backend;
  owner.kind = kind;
  return _accounts.emplace_back(std::make_shared<Account>(std::move(owner), _tap));
}

SessionCounts SessionBook::counts() const {
  const std::lock_guard lock(_mutex);
  SessionCounts counts{_messages.counts(), _uploads.counts(), _folded};
  for (const auto& account : _accounts) {
    counts.backends[{account->owner().backend, account->owner().kind}] += account->counts();
  }
  return counts;
}

Dictionary SessionBook::description() const {
  const std::lock_guard lock(_mutex);
  Dictionary description{{"session", _owner.session},
                         {"sessionID", _owner.sessionID},
                         {"clientType", std::int64_t{_owner.clientType}}};
  if (!_owner.clientName.empty()) description.set("clientName", _owner.clientName);
  return description;
}

bool SessionBook::fold() {
  const std::lock_guard lock(_mutex);
  return foldLocked();
}

bool SessionBook::foldLocked() {
  // Copies are only ever made from copies: once this is the last one, it stays the last.
  std::erase_if(_accounts, [this](const std::shared_ptr<Account>& account) {
    if (account.use_count() > 1) return false;
    _folded[{account->owner().backend, account->owner().kind}] += account->counts();
    return true;
  });
  return _accounts.empty();
}

}  // namespace tallyd
