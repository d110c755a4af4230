// Which datagrams came before.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <unordered_map>

namespace tallyd::station {

/// Counts how often each datagram arrived and how often it was delivered, which differs where some are lost
/// on purpose. Remembers the latest `capacity` different ones; what is forgotten is new again.
///
/// Threading: one thread.
class DatagramHistory {
 public:
  /// @param capacity  At least 1.
  explicit DatagramHistory(std::size_t capacity) : _capacity(capacity) {}

  /// How often it had arrived before this time.
  std::uint64_t noteArrival(const std::string& identity) { return countsOf(identity).arrivals++; }
  void noteDelivery(const std::string& identity) { ++countsOf(identity).deliveries; }
  /// How often it was delivered.
  [[nodiscard]] std::uint64_t deliveries(const std::string& identity) const {
    const auto found = _counts.find(identity);
    return found == _counts.end() ? 0 : found->second.deliveries;
  }

 private:
  struct Counts {
    std::uint64_t arrivals = 0;
    std::uint64_t deliveries = 0;
  };

  Counts& countsOf(const std::string& identity) {
    const auto [counts, isNew] = _counts.try_emplace(identity);
    if (isNew) _order.push_back(identity);
    if (_order.size() > _capacity) {
      _counts.erase(_order.front());
      _order.pop_front();
    }
    return counts->second;
  }

  const std::size_t _capacity;
  std::unordered_map<std::string, Counts> _counts;
  std::deque<std::string> _order;  ///< Oldest first.
};

}  // namespace tallyd::station
