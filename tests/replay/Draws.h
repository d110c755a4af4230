// Draws that are the same everywhere for one seed.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tallyd::replay {

/// The generator SplitMix64. The standard library's distributions differ between implementations; these do
/// not.
class Draws {
 public:
  explicit Draws(std::uint64_t seed) : _state(seed) {}

  std::uint64_t next() {
    _state += 0x9E3779B97F4A7C15U;
    std::uint64_t bits = _state;
    bits = (bits ^ (bits >> 30U)) * 0xBF58476D1CE4E5B9U;
    bits = (bits ^ (bits >> 27U)) * 0x94D049BB133111EBU;
    return bits ^ (bits >> 31U);
  }
  /// In [0, 1).
  double unit() { return static_cast<double>(next() >> 11U) / static_cast<double>(std::uint64_t{1} << 53U); }
  /// Both ends are possible.
  std::int64_t between(std::int64_t least, std::int64_t most) {
    return least + static_cast<std::int64_t>(next() % static_cast<std::uint64_t>(most - least + 1));
  }
  bool chance(double probability) { return unit() < probability; }
  template <class List>
  const auto& pick(const List& list) {
    return list[static_cast<std::size_t>(between(0, static_cast<std::int64_t>(list.size()) - 1))];
  }

 private:
  std::uint64_t _state;
};

}  // namespace tallyd::replay
