#include "daemon/Drain.h"

#include <fmt/format.h>

#include <iterator>
#include <utility>

namespace tallyd {

using std::chrono::milliseconds;

namespace {

AccountCounts sumOfBackends(const SessionCounts& totals) {
  AccountCounts sum;
  for (const auto& [backend, counts] : totals.backends) sum += counts;
  return sum;
}

std::string droppedByReason(const AccountCounts& counts) {
  std::string text;
  for (std::size_t i = 0; i < kDropReasonCount; ++i) {
    if (counts.dropped[i] == 0) continue;
    fmt::format_to(std::back_inserter(text), "{}{} {}", text.empty() ? " (" : ", ", kDropReasonNames[i],
                   counts.dropped[i]);
  }
  return text.empty() ? text : text + ")";
}

}  // namespace

/// Its timers go with it.
class Drain::Watch : public std::enable_shared_from_this<Watch> {
 public:
  Watch(platform::Queues& queues, Ledger& ledger)
      : _ledger(ledger), _queue(queues.makeSerialQueue("com.quillon.tallyd.drain")) {}

  void start(milliseconds time, Done done) {
    _queue->async([self = shared_from_this(), time, done = std::move(done)]() mutable {
      self->_done = std::move(done);
      self->_timer = self->_queue->makeTimer(milliseconds(0), kLookPeriod,
                                             [weak = self->weak_from_this()] { lookAt(weak); });
      self->_deadline = self->_queue->makeTimer(time, time, [weak = self->weak_from_this()] {
        if (const auto watch = weak.lock()) watch->end(watch->verdict());
      });
    });
  }

 private:
  static void lookAt(const std::weak_ptr<Watch>& weak) {
    const auto watch = weak.lock();
    if (watch && watch->_ledger.isSettled()) watch->end(End::Settled);
  }

  [[nodiscard]] End verdict() { return _ledger.isSettled() ? End::Settled : End::TimeOver; }

  void end(End end) {
    stop();
    if (const auto done = std::exchange(_done, nullptr)) done(end);
  }

  void stop() {
    _timer.reset();
    _deadline.reset();
  }

  Ledger& _ledger;
  const std::shared_ptr<platform::SerialQueue> _queue;
  Done _done;
  std::unique_ptr<platform::Source> _timer;
  std::unique_ptr<platform::Source> _deadline;
};

Drain::Drain(platform::Queues& queues, Ledger& ledger) : _watch(std::make_shared<Watch>(queues, ledger)) {}

Drain::~Drain() = default;

void Drain::start(milliseconds time, Done done) { _watch->start(time, std::move(done)); }

std::string balanceLine(const SessionCounts& totals) {
  const AccountCounts counts = sumOfBackends(totals);
  return fmt::format("Drained: accepted {}, sent {}, dropped {}{}, not finished {}.", counts.accepted,
                     counts.sent, counts.droppedInAll(), droppedByReason(counts), unfinishedOf(totals));
}

std::uint64_t unfinishedOf(const SessionCounts& totals) {
  const AccountCounts counts = sumOfBackends(totals);
  return counts.held + counts.inFlight;
}

}  // namespace tallyd
