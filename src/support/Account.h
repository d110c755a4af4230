// The books of one way out of the daemon: what it took, and where every piece of it is or ended.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"
#include "support/DropReason.h"
#include "support/Tap.h"

namespace tallyd {

/// What an account says at one instant. accepted = sent + held + inFlight + all that was dropped.
struct AccountCounts {
  std::uint64_t accepted = 0;
  std::uint64_t sent = 0;
  std::uint64_t refused = 0;   ///< Of those sent: the server answered with a status of 400 or above.
  std::uint64_t held = 0;      ///< Kept here until it may or can be sent.
  std::uint64_t inFlight = 0;  ///< On its way; what became of it is not known yet.
  std::uint64_t passedBy = 0;  ///< Not accepted: offered, and of a sort that this way out does not carry.
  std::array<std::uint64_t, kDropReasonCount> dropped{};

  [[nodiscard]] std::uint64_t droppedFor(DropReason reason) const {
    return dropped[static_cast<std::size_t>(reason)];
  }
  [[nodiscard]] std::uint64_t& droppedFor(DropReason reason) {
    return dropped[static_cast<std::size_t>(reason)];
  }
  [[nodiscard]] std::uint64_t droppedInAll() const;
  [[nodiscard]] bool isBalanced() const { return accepted == sent + held + inFlight + droppedInAll(); }
  AccountCounts& operator+=(const AccountCounts& other);
  bool operator==(const AccountCounts&) const = default;

  /// By the members' names; "dropped" by the reasons' names, without those that have not occurred.
  [[nodiscard]] platform::Dictionary dictionary() const;
};

/// Whose books an account keeps; what the tap shows with each line.
struct AccountOwner {
  std::uint64_t session = 0;  ///< The daemon's own number of the session.
  std::uint32_t sessionID = 0;
  std::int32_t clientType = 0;
  std::string clientName{};
  std::string backend{};  ///< The storebag's key.
  std::string kind{};     ///< TallyBackend::kind().
};

/// Which message is meant, where that is known.
struct MessageNumbers {
  std::uint16_t method;
  std::optional<std::uint16_t> eventNumber{};  ///< Backends number messages; a session does not.
};

/// Counts what one backend of one session takes and what becomes of it, in the unit of the backend's kind:
/// events, datagrams, files, records.
///
/// Every operation is one step under the lock and leaves the account balanced, so that a look at any instant
/// finds each piece in exactly one place. Counting allocates nothing; only a drop that somebody watches costs
/// more.
///
/// Shared, as datagrams and posts outlive the backend that sent them. Threading: any thread.
class Account {
 public:
  /// An account that is in nobody's ledger.
  Account() = default;
  /// @param tap  where drops are shown; may be null.
  Account(AccountOwner owner, std::shared_ptr<Tap> tap) : _owner(std::move(owner)), _tap(std::move(tap)) {}
  Account(const Account&) = delete;
  Account& operator=(const Account&) = delete;

  enum class Answer { Taken, Refused };

  // What is new.
  void start(std::uint64_t count = 1);  ///< Goes on its way.
  void hold(std::uint64_t count = 1);   ///< Is held back.
  void send(std::uint64_t count = 1);   ///< Has been sent at once.
  void dropNew(DropReason reason, std::uint64_t count = 1, const std::optional<MessageNumbers>& message = {});
  void passBy();  ///< Is not of this account's sort.

  // What is held back.
  void startHeld(std::uint64_t count = 1);
  void dropHeld(DropReason reason, std::uint64_t count = 1,
                const std::optional<MessageNumbers>& message = {});

  // What is on its way.
  void holdBack(std::uint64_t count = 1);
  void finish(std::uint64_t count = 1, Answer answer = Answer::Taken);
  void drop(DropReason reason, std::uint64_t count = 1, const std::optional<MessageNumbers>& message = {});

  [[nodiscard]] AccountCounts counts() const;
  [[nodiscard]] const AccountOwner& owner() const { return _owner; }

  /// The tap while somebody listens, else null.
  [[nodiscard]] Tap* listeningTap() const noexcept {
    return _tap && _tap->isListening() ? _tap.get() : nullptr;
  }
  /// Shows a line about this account's owner; `describe` adds to it and is called only if somebody listens.
  /// A line for which there is no memory counts as missed.
  template <class Describe>
  void show(std::string_view kind, Describe&& describe) const {
    Tap* const tap = listeningTap();
    if (!tap) return;
    try {
      TapLine line = ownersLine(*tap, kind);
      describe(line);
      tap->write(std::move(line));
    } catch (const std::bad_alloc&) {
      tap->miss();
    }
  }

 private:
  [[nodiscard]] TapLine ownersLine(const Tap& tap, std::string_view kind) const;
  void showDrop(DropReason reason, std::uint64_t count, const std::optional<MessageNumbers>& message) const;

  const AccountOwner _owner{};
  const std::shared_ptr<Tap> _tap;
  mutable std::mutex _mutex;
  AccountCounts _counts;
};

}  // namespace tallyd
