// The storebags that the simulated server gives out.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::replay {

/// The largest batch limit of all editions, with that of a backend that no entry applies to.
inline constexpr int kHighestEventThreshold = 49;

/// The storebag of a client type; nothing for a type that has none.
[[nodiscard]] std::optional<std::string_view> storebagNameOf(std::int64_t clientType);

[[nodiscard]] bool isStorebagName(std::string_view name);

/// The bag of the storebag named so: every environment, with backends of all kinds. Editions differ in
/// limits, shares and rules.
[[nodiscard]] platform::Dictionary storebagNamed(std::string_view name, int edition);

/// The environments are missing.
[[nodiscard]] platform::Dictionary storebagWithoutSections();
/// Whole but for its version, which ends a daemon that is not resilient.
[[nodiscard]] platform::Dictionary storebagWithoutVersion(std::string_view name, int edition);
/// What the storebag says to every device.
[[nodiscard]] platform::Dictionary sectionOf(std::string_view name, int edition);

/// The timer period of the dashboard at this port; the same in all editions.
[[nodiscard]] std::chrono::milliseconds dashboardPeriod(std::uint16_t port);

}  // namespace tallyd::replay
