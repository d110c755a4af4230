// One direction of a bad network: packets go in, some come out, some later, some twice.
#pragma once

#include <netinet/in.h>

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "station/LossModel.h"

namespace tallyd::station {

/// A datagram under way, and the address at its other end.
struct Packet {
  std::string bytes;
  sockaddr_in peer{};
  std::uint64_t earlierArrivals = 0;  ///< How often these bytes came before.
};

/// Holds packets until they are due. A reordered packet waits until the next one that is not reordered has
/// gone, for kReorderPatience at most.
///
/// Holds at most kMaximumHeldPackets; what comes then is lost.
///
/// Threading: one thread; time comes in from outside and never goes back.
class LossyPath {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;

  LossyPath(const LossModel::Shares& shares, std::chrono::milliseconds delay, std::uint64_t seed)
      : _model(shares, seed), _delay(delay) {}

  /// Takes a packet; false when it is lost.
  bool put(Packet packet, TimePoint now);
  /// What is due, in the order in which it comes out.
  [[nodiscard]] std::vector<Packet> take(TimePoint now);
  /// When something is due next; nothing when nothing is held.
  [[nodiscard]] std::optional<TimePoint> nextDue() const;

  [[nodiscard]] std::uint64_t lost() const { return _lost; }

 private:
  using Place = std::pair<TimePoint, std::uint64_t>;  ///< When it is due; then, the order among equals.

  void hold(Packet packet, TimePoint due) { _held.emplace(Place{due, _nextOrder++}, std::move(packet)); }
  void letReorderedFollow(TimePoint due);

  LossModel _model;
  const std::chrono::milliseconds _delay;
  std::map<Place, Packet> _held;
  std::vector<Place> _reordered;  ///< Places of those that wait to be overtaken; some may have gone.
  std::uint64_t _nextOrder = 0;
  std::uint64_t _lost = 0;
};

}  // namespace tallyd::station
