// The real daemon under load, on real sockets, and what it takes while it carries it.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "integration/TestDaemon.h"
#include "support/ProcessFigures.h"
#include "support/RawServer.h"

namespace tallyd::test {

/// Takes posts and counts the events in them; keeps nothing.
class CountingCollector {
 public:
  CountingCollector();
  [[nodiscard]] std::string url() const { return _server.url("/events"); }
  [[nodiscard]] std::uint64_t events() const { return _events; }

 private:
  void serve(RawConnection& connection);

  std::atomic<std::uint64_t> _events{0};
  RawServer _server;  ///< Last: its threads count.
};

/// Many clients at once: all are connected and have had an answer, some have started sessions and send.
struct Crowd {
  std::size_t connections = 10'000;
  std::size_t active = 1'000;
  /// In each, every active client sends a message and waits for the answer; it ends when all are posted.
  std::size_t rounds = 20;
  std::chrono::seconds atLeast{0};  ///< Rounds go on for this long.
};

/// Lets this process have as many descriptors as it may, for the crowd's connections and some more; a daemon
/// may have as many.
///
/// Throws std::runtime_error, which says what limit is needed, when that is too few.
void takeDescriptorsFor(const Crowd& crowd);

/// The messages of a busy device's day: in each hour, `postingSessions` clients come, send
/// `eventsOfAPostingSession` events that are posted one by one, and leave; `batchingSessions` clients send
/// `eventsOfABatchingSession` events of three methods and flush after every 30th. The user consents, so that
/// every post is written to the message log too. Clients of an hour come over four lanes, one after the other
/// in each, as fast as they are served. An hour begins when all of the last one's events have been posted.
struct Days {
  std::size_t postingSessions = 40;
  std::size_t eventsOfAPostingSession = 50;
  std::size_t batchingSessions = 20;
  std::size_t eventsOfABatchingSession = 120;
  std::size_t firstHours = 12;  ///< Not sampled: until the allocator has what it comes to need.
  std::size_t hours = 24;
  std::chrono::seconds atLeast{0};  ///< Hours go on for this long.
};

/// What a run came to.
struct LoadResult {
  std::string name;
  std::size_t connections = 0;  ///< Held at a time.
  std::uint64_t sessions = 0;   ///< Started.
  std::uint64_t messages = 0;   ///< Sent by clients.
  double seconds = 0;
  ProcessFigures before;                ///< After a first session.
  std::vector<ProcessFigures> samples;  ///< One a round or an hour.
  ProcessFigures after;                 ///< When all clients have left and everything is sent.
  std::uint64_t accepted = 0;           ///< By the books.
  std::uint64_t sent = 0;
  std::uint64_t arrived = 0;  ///< At the collector.
  bool balanced = true;       ///< In every look at the books.

  /// Medians of the samples' second and third tenth, and of their last two: what is lost for good shows in
  /// them, and what a moment needs does not.
  [[nodiscard]] std::size_t earlyBytes() const { return medianBytes(1, 3); }
  [[nodiscard]] std::size_t lateBytes() const { return medianBytes(8, 10); }
  /// What is held late beyond what was held early is within what the allocator's own habits need: 3 % and a
  /// mebibyte.
  [[nodiscard]] bool hasFlatMemory() const;
  /// As few threads and descriptors as before, but for the collector's idle connections and the inspection's.
  [[nodiscard]] bool leavesNothing() const;

 private:
  /// Of the samples from one tenth up to another one, which is left out.
  [[nodiscard]] std::size_t medianBytes(std::size_t fromTenth, std::size_t toTenth) const;
};

/// A daemon with its servers. One run each.
class LoadBench {
 public:
  LoadBench();

  /// Throws what takeDescriptorsFor() does.
  [[nodiscard]] LoadResult run(const Crowd& crowd);
  [[nodiscard]] LoadResult run(const Days& days);

 private:
  [[nodiscard]] ProcessFigures figures() { return figuresOf(_daemon.process().pid()); }
  void runFirstSession();
  void waitForPosts(LoadResult& result);  ///< Until nothing is under way.
  void finish(LoadResult& result);

  StorebagServer _storebags;
  CountingCollector _collector;
  TestRoot _root{_storebags};
  const int _prepared;  ///< The root, before the daemon reads it.
  TestDaemon _daemon;
};

}  // namespace tallyd::test
