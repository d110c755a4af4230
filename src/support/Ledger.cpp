#include "support/Ledger.h"

#include <algorithm>

namespace tallyd {

using platform::Array;
using platform::Dictionary;

Ledger::Ledger(std::shared_ptr<Tap> tap) : _tap(std::move(tap)) {}

std::shared_ptr<SessionBook> Ledger::openBook() {
  const std::lock_guard lock(_mutex);
  if (_books.size() >= _sweepAt) sweep();
  return _books.emplace_back(std::make_shared<SessionBook>(++_lastNumber, _tap));
}

void Ledger::connectionAccepted() {
  const std::lock_guard lock(_mutex);
  ++_accepted;
  ++_open;
}

void Ledger::connectionEnded() {
  const std::lock_guard lock(_mutex);
  --_open;
}

void Ledger::sweep() {
  std::erase_if(_books, [this](const std::shared_ptr<SessionBook>& book) {
    if (book.use_count() > 1 || !book->fold()) return false;
    _ended += book->counts();
    ++_endedSessions;
    return true;
  });
  // Twice what is left: so that sweeping costs each book that is opened a constant time on average.
  _sweepAt = std::max(kLeastSweep, 2 * _books.size());
}

Ledger::Look Ledger::look() {
  const std::lock_guard lock(_mutex);
  sweep();
  Look look{_accepted, _open, {}, {}, _ended, _endedSessions};
  for (const auto& book : _books) (book.use_count() > 1 ? look.live : look.unsettled).push_back(book);
  return look;
}

SessionCounts Ledger::totals() {
  const Look look = this->look();
  SessionCounts total = look.ended;
  for (const auto& book : look.unsettled) total += book->counts();
  for (const auto& book : look.live) total += book->counts();
  return total;
}

bool Ledger::isSettled() {
  const std::lock_guard lock(_mutex);
  sweep();
  return _books.empty();
}

Dictionary Ledger::snapshot() {
  Look look = this->look();
  for (const auto& book : look.unsettled) look.ended += book->counts();
  SessionCounts total = look.ended;
  Array sessions;
  for (const auto& book : look.live) {
    const SessionCounts counts = book->counts();
    total += counts;
    if (sessions.size() >= kMaximumSessionsShown) continue;
    Dictionary session = book->description();
    session.merge(counts.dictionary());
    sessions.append(session);
  }
  Dictionary ended = look.ended.dictionary();
  ended.set("sessions", look.endedSessions + look.unsettled.size());
  const std::size_t notShown = look.live.size() - sessions.size();
  return {{"connections", Dictionary{{"accepted", look.accepted}, {"open", look.open}}},
          {"sessions", sessions},
          {"sessionsNotShown", std::uint64_t{notShown}},
          {"ended", ended},
          {"total", total.dictionary()}};
}

}  // namespace tallyd
