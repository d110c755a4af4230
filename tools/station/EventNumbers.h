// Which of a session's event numbers came, and which are missing.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tallyd::station {

/// Counts numbers as they come, in any order. Missing is what lies between the lowest and the highest that
/// came: nothing tells how many were to come before or after.
///
/// A number far below the highest begins a new round: sessions count in 16 bits. Holds a bit for each number
/// of the round, 8 KiB at most.
///
/// Threading: one thread.
class EventNumbers {
 public:
  void add(std::uint16_t number);
  /// Begins a new round: the session has started again.
  void beginRound();

  [[nodiscard]] std::uint64_t distinct() const { return _earlierDistinct + _distinct; }
  [[nodiscard]] std::uint64_t repeated() const { return _repeated; }
  [[nodiscard]] std::uint64_t missing() const { return _earlierMissing + missingInRound(); }
  /// "3, 7–9" of this round's first `most` gaps, with ", …" when there are more; empty without a gap.
  [[nodiscard]] std::string missingText(std::size_t most) const;

 private:
  [[nodiscard]] std::uint64_t missingInRound() const;

  std::vector<bool> _came;
  std::uint16_t _lowest = 0;
  std::uint16_t _highest = 0;
  std::uint64_t _distinct = 0;
  std::uint64_t _repeated = 0;
  std::uint64_t _earlierDistinct = 0;
  std::uint64_t _earlierMissing = 0;
};

}  // namespace tallyd::station
