// The daemon's books: every session's, those of sessions that have ended, and the connections.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/Value.h"
#include "support/SessionBook.h"

namespace tallyd {

/// Opens a book for each session and adds it up with the others' when the session has ended and everything
/// that it sent has been settled.
///
/// Holds one book for every session that exists or has something under way, and at most as many again, or
/// kLeastSweep, that are to be added up. Threading: any thread.
class Ledger {
 public:
  static constexpr std::size_t kLeastSweep = 64;
  /// Sessions that a snapshot shows one by one; the rest is in its totals. Keeps it below what one D-Bus
  /// message may carry.
  static constexpr std::size_t kMaximumSessionsShown = 10'000;

  /// @param tap  what accounts show their drops on; may be null.
  explicit Ledger(std::shared_ptr<Tap> tap = nullptr);

  /// The session holds its book for as long as it lives.
  [[nodiscard]] std::shared_ptr<SessionBook> openBook();
  void connectionAccepted();
  void connectionEnded();

  /// The sum of all sessions.
  [[nodiscard]] SessionCounts totals();
  /// Whether every session has ended and nothing that it took is under way any more.
  [[nodiscard]] bool isSettled();

  /// A dictionary:
  /// "connections": {"accepted", "open"};
  /// "sessions": an array, each what SessionBook::description() and SessionCounts::dictionary() say;
  /// "sessionsNotShown": how many more there are;
  /// "ended": the sum of the sessions that have ended, with their number as "sessions";
  /// "total": the sum of all.
  ///
  /// Every account in it is seen at one instant, though not all at the same.
  [[nodiscard]] platform::Dictionary snapshot();

 private:
  /// What a snapshot is made of.
  struct Look {
    std::uint64_t accepted;
    std::uint64_t open;
    std::vector<std::shared_ptr<SessionBook>> live;
    std::vector<std::shared_ptr<SessionBook>> unsettled;
    SessionCounts ended;
    std::uint64_t endedSessions;
  };

  [[nodiscard]] Look look();
  void sweep();

  const std::shared_ptr<Tap> _tap;
  std::mutex _mutex;
  std::uint64_t _lastNumber = 0;
  std::uint64_t _accepted = 0;
  std::uint64_t _open = 0;
  std::vector<std::shared_ptr<SessionBook>> _books;
  std::size_t _sweepAt = kLeastSweep;  ///< Books.
  SessionCounts _ended;
  std::uint64_t _endedSessions = 0;
};

}  // namespace tallyd
