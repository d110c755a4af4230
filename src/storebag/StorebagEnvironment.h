// Which storebag, from which server, for which environment.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// The storebag's name for a client type; nothing for the types that have none.
[[nodiscard]] std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType);

/// 1 "development", 2 "quillon_internal", 3 "seed", 4 "release"; nothing for every other type.
[[nodiscard]] std::optional<std::string_view> environmentNameForType(std::uint32_t environmentType);

inline constexpr std::uint32_t kEnvironmentTypeInternal = 2;
inline constexpr std::uint32_t kEnvironmentTypeSeed = 3;
inline constexpr std::uint32_t kEnvironmentTypeRelease = 4;

/// The preference "environmentType", else by the build; decided at the first call and kept for the life of
/// the process.
[[nodiscard]] std::uint32_t currentEnvironmentType(const platform::Platform& platform);

/// The storebag server's URL, built in or as the preference gives it. The preference "tally_storebag_url" is
/// read at the first call and kept for the life of the process.
[[nodiscard]] std::string storebagBaseURL(const platform::Platform& platform);

/// The preference "httpsPostURL" as it stands now.
[[nodiscard]] std::optional<std::string> httpsPostURLFromPreferences(const platform::Platform& platform);

}  // namespace tallyd
