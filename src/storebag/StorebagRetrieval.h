// Fetches the storebag of a client type and checks its signature.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Fatal.h"
#include "platform/Value.h"

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// One attempt to fetch a storebag.
struct StorebagFetch {
  std::optional<platform::Dictionary>
      storebag;                        ///< The section of the current environment; nothing on failure.
  std::optional<std::string> version;  ///< Of the whole bag; there whenever a storebag is.
  std::int32_t maxAgeSeconds = 0;      ///< From the response, of a failed attempt too when one arrived.
};

/// Fetches, verifies and cuts out the current environment's section. Logs every failure. A bag that holds the
/// section but no "version", and a "Cache-Control" that ends in "max-age", are fatal failures; where the
/// process goes on, the fetch has failed.
///
/// Threading: any thread; blocks for up to 15 s.
[[nodiscard]] StorebagFetch fetchStorebagForClientType(
    const platform::Platform& platform, std::int32_t clientType,
    platform::FatalFailures fatalFailures = platform::FatalFailures::EndProcess);

/// The verified bag under `storebagName`, all environments; nothing on failure. Writes `maxAgeSeconds` once a
/// response arrived that states one.
[[nodiscard]] std::optional<platform::Dictionary> fetchSignedStorebag(
    const platform::Platform& platform, std::optional<std::string_view> storebagName,
    std::int32_t& maxAgeSeconds, platform::FatalFailures fatalFailures = platform::FatalFailures::EndProcess);

/// What a "Cache-Control" header allows.
struct CacheAge {
  bool endsInMaxAge =
      false;  ///< "max-age" is the last component: it has no number, and whoever asks for it fails.
  std::int32_t maxAgeSeconds = 0;
};

/// Seconds for which a response may be reused: 0 without the header, 86,400 when it names no "max-age", else
/// the number behind the first component "max-age", the components being what stands between "=" signs and
/// spaces.
[[nodiscard]] CacheAge cacheAgeFromHeader(std::optional<std::string_view> cacheControl);

}  // namespace tallyd
