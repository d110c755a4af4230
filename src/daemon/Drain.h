// The orderly end: what is under way gets a while, then the books are closed.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "platform/SerialQueue.h"
#include "support/Ledger.h"

namespace tallyd {

/// Waits until every session has ended and all that they took is settled, or the time is over.
///
/// Threading: start() once, from any thread; `done` is called once, on a queue of this object's own.
class Drain {
 public:
  enum class End { Settled, TimeOver };
  using Done = std::function<void(End)>;
  /// How often it looks: a client that waits for the daemon's end does not notice, nor does the processor.
  static constexpr std::chrono::milliseconds kLookPeriod{20};

  /// Borrows both.
  Drain(platform::Queues& queues, Ledger& ledger);
  ~Drain();
  Drain(const Drain&) = delete;
  Drain& operator=(const Drain&) = delete;

  void start(std::chrono::milliseconds time, Done done);

 private:
  class Watch;
  const std::shared_ptr<Watch> _watch;
};

/// One line that says what all backends together took, and what became of it.
[[nodiscard]] std::string balanceLine(const SessionCounts& totals);

/// What no backend has brought to an end.
[[nodiscard]] std::uint64_t unfinishedOf(const SessionCounts& totals);

}  // namespace tallyd
