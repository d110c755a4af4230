// What the station has taken in, for whoever watches.
#pragma once

#include <array>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace tallyd::station {

/// The latest records of each kind, numbered in the order in which they came.
///
/// Holds at most `capacityPerKind` records of each kind; the oldest of a kind makes room for its newest, so
/// that a flood of one kind leaves the others alone.
///
/// Threading: any thread.
class Feed {
 public:
  enum class Kind { Event, Datagram, Upload, LogData };
  static constexpr std::size_t kKinds = 4;

  struct Entry {
    std::uint64_t number;  ///< From 1, across kinds.
    Kind kind;
    std::shared_ptr<const std::string> record;  ///< Never null.
  };

  explicit Feed(std::size_t capacityPerKind) : _capacityPerKind(capacityPerKind) {}

  /// @param record  One JSON object in one line, without the line feed.
  void publish(Kind kind, std::string record);

  /// The entries that are still held with a number above `number`, oldest first.
  [[nodiscard]] std::vector<Entry> since(std::uint64_t number) const;

  /// Waits for an entry with a number above `number`. False when `patience` is over, or the feed closed,
  /// without one.
  [[nodiscard]] bool waitForMore(std::uint64_t number, std::chrono::milliseconds patience) const;

  /// Wakes all waiters for good: from now on nobody waits. Records are still taken.
  void close();

 private:
  const std::size_t _capacityPerKind;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::array<std::deque<Entry>, kKinds> _entries;
  std::uint64_t _lastNumber = 0;
  bool _closed = false;
};

}  // namespace tallyd::station
