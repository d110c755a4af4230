// What holds after every step of a simulated day, and at its end.
#pragma once

#include <cstdint>
#include <string>

#include "platform/Value.h"
#include "replay/PostModel.h"
#include "replay/Surroundings.h"

namespace tallyd {
class Ledger;
}

namespace tallyd::replay {

/// Compares the daemon's books with themselves and with what the world received.
class Invariants {
 public:
  /// Borrows them all.
  Invariants(Ledger& ledger, Surroundings& world, const PostModel& model)
      : _ledger(ledger), _world(world), _model(model) {}

  /// After a step, between a client's calls or while one waits. Does nothing when nothing was traced since
  /// the last look.
  void check();
  /// After the last connection has gone and everything has run out. `ownQueues`: those of the world and the
  /// tap, which stay.
  void checkEnd(std::size_t ownQueues);

 private:
  /// One account, or a sum of such.
  struct Row {
    std::string what;
    std::uint64_t accepted = 0;
    std::uint64_t sent = 0;
    std::uint64_t refused = 0;
    std::uint64_t held = 0;
    std::uint64_t inFlight = 0;
    platform::Dictionary dropped{};

    [[nodiscard]] std::uint64_t droppedFor(std::string_view reason) const;
    [[nodiscard]] std::uint64_t droppedInAll() const;
  };

  static Row rowOf(const platform::Dictionary& counts, std::string what);
  /// All backends of a kind in "total".
  static Row sumOf(const platform::Dictionary& snapshot, std::string_view kind);
  static void add(Row& sum, const Row& row);

  void checkBalance(const Row& row);
  void checkBalances(const platform::Dictionary& part, const std::string& what);
  void checkOffers(const platform::Dictionary& total);
  void checkSession(const platform::Dictionary& session);
  void checkPosts(const Row& posts);
  void checkForecast(const Row& posts);
  void checkUploads(const Row& uploads);
  void checkDashboards(const Row& dashboards);
  void checkOnDevice(const platform::Dictionary& snapshot);
  void equal(std::string_view what, std::uint64_t booked, std::uint64_t seen);
  void within(std::string_view what, std::uint64_t booked, std::uint64_t seen, std::uint64_t uncertain);
  void atMost(std::string_view what, std::uint64_t number, std::uint64_t most);

  Ledger& _ledger;
  Surroundings& _world;
  const PostModel& _model;
  std::size_t _linesChecked = 0;
};

}  // namespace tallyd::replay
