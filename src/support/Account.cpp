#include "support/Account.h"

#include <cassert>
#include <numeric>

namespace tallyd {

using platform::Dictionary;

namespace {

void take(std::uint64_t& from, std::uint64_t count) {
  assert(from >= count);
  from -= count;
}

}  // namespace

std::uint64_t AccountCounts::droppedInAll() const {
  return std::accumulate(dropped.begin(), dropped.end(), std::uint64_t{0});
}

AccountCounts& AccountCounts::operator+=(const AccountCounts& other) {
  accepted += other.accepted;
  sent += other.sent;
  refused += other.refused;
  held += other.held;
  inFlight += other.inFlight;
  passedBy += other.passedBy;
  for (std::size_t i = 0; i < dropped.size(); ++i) dropped[i] += other.dropped[i];
  return *this;
}

Dictionary AccountCounts::dictionary() const {
  Dictionary reasons;
  for (std::size_t i = 0; i < dropped.size(); ++i) {
    if (dropped[i] > 0) reasons.set(kDropReasonNames[i], dropped[i]);
  }
  return {{"accepted", accepted}, {"sent", sent},         {"refused", refused}, {"held", held},
          {"inFlight", inFlight}, {"passedBy", passedBy}, {"dropped", reasons}};
}

void Account::start(std::uint64_t count) {
  const std::lock_guard lock(_mutex);
  _counts.accepted += count;
  _counts.inFlight += count;
}

void Account::hold(std::uint64_t count) {
  const std::lock_guard lock(_mutex);
  _counts.accepted += count;
  _counts.held += count;
}

void Account::send(std::uint64_t count) {
  const std::lock_guard lock(_mutex);
  _counts.accepted += count;
  _counts.sent += count;
}

void Account::dropNew(DropReason reason, std::uint64_t count, const std::optional<MessageNumbers>& message) {
  {
    const std::lock_guard lock(_mutex);
    _counts.accepted += count;
    _counts.droppedFor(reason) += count;
  }
  showDrop(reason, count, message);
}

void Account::passBy() {
  const std::lock_guard lock(_mutex);
  ++_counts.passedBy;
}

void Account::startHeld(std::uint64_t count) {
  const std::lock_guard lock(_mutex);
  take(_counts.held, count);
  _counts.inFlight += count;
}

void Account::dropHeld(DropReason reason, std::uint64_t count, const std::optional<MessageNumbers>& message) {
  {
    const std::lock_guard lock(_mutex);
    take(_counts.held, count);
    _counts.droppedFor(reason) += count;
  }
  showDrop(reason, count, message);
}

void Account::holdBack(std::uint64_t count) {
  const std::lock_guard lock(_mutex);
  take(_counts.inFlight, count);
  _counts.held += count;
}

void Account::finish(std::uint64_t count, Answer answer) {
  const std::lock_guard lock(_mutex);
  take(_counts.inFlight, count);
  _counts.sent += count;
  if (answer == Answer::Refused) _counts.refused += count;
}

void Account::drop(DropReason reason, std::uint64_t count, const std::optional<MessageNumbers>& message) {
  {
    const std::lock_guard lock(_mutex);
    take(_counts.inFlight, count);
    _counts.droppedFor(reason) += count;
  }
  showDrop(reason, count, message);
}

AccountCounts Account::counts() const {
  const std::lock_guard lock(_mutex);
  return _counts;
}

TapLine Account::ownersLine(const Tap& tap, std::string_view kind) const {
  TapLine line = tap.line(kind);
  line.add("session", _owner.session).add("sessionID", _owner.sessionID);
  line.add("clientType", std::int64_t{_owner.clientType});
  if (!_owner.clientName.empty()) line.add("clientName", _owner.clientName);
  if (!_owner.backend.empty()) line.add("backend", _owner.backend).add("backendKind", _owner.kind);
  return line;
}

void Account::showDrop(DropReason reason, std::uint64_t count,
                       const std::optional<MessageNumbers>& message) const {
  if (count == 0) return;
  show("drop", [&](TapLine& line) {
    line.add("reason", nameOf(reason)).add("count", count);
    if (!message) return;
    line.add("method", unsigned{message->method});
    if (message->eventNumber) line.add("event", unsigned{*message->eventNumber});
  });
}

}  // namespace tallyd
