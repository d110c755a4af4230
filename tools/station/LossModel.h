// What a bad network would do to each datagram, decided by lot.
#pragma once

#include <cstdint>
#include <optional>
#include <random>
#include <string_view>

namespace tallyd::station {

/// A share of all datagrams.
class Share {
 public:
  static constexpr std::uint64_t kWhole = 1'000'000;

  Share() = default;  ///< None.
  /// Of a percentage from 0 to 100, with or without a fraction and a percent sign; nothing for another text.
  [[nodiscard]] static std::optional<Share> ofPercentage(std::string_view text);

  [[nodiscard]] std::uint64_t partsPerMillion() const { return _partsPerMillion; }
  bool operator==(const Share&) const = default;

 private:
  explicit Share(std::uint64_t partsPerMillion) : _partsPerMillion(partsPerMillion) {}
  std::uint64_t _partsPerMillion = 0;
};

/// Draws the fate of one datagram after the other. The same seed draws the same lots, on any machine; each
/// datagram takes as many lots, so that a changed share changes only what that share decides.
///
/// Threading: one thread.
class LossModel {
 public:
  struct Shares {
    Share lost{};
    Share duplicated{};  ///< Of all, like the next; what is lost is only lost.
    Share reordered{};
  };
  struct Fate {
    bool isLost = false;
    bool isDuplicated = false;
    bool isReordered = false;
    bool operator==(const Fate&) const = default;
  };

  LossModel(const Shares& shares, std::uint64_t seed) : _shares(shares), _lots(seed) {}

  [[nodiscard]] Fate next();

 private:
  [[nodiscard]] bool drawn(Share share) { return _lots() % Share::kWhole < share.partsPerMillion(); }

  const Shares _shares;
  std::mt19937_64 _lots;  ///< The standard fixes what it gives; it does not for distributions.
};

}  // namespace tallyd::station
