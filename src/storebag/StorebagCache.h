// Keeps the last fetched storebag of every client type and decides when to fetch again.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "platform/Clock.h"
#include "platform/Value.h"
#include "storebag/StorebagRetrieval.h"

namespace tallyd {

/// What is known of one client type's storebag.
struct CachedStorebag {
  enum class FetchState { Successful, Failure };

  std::optional<platform::Dictionary> storebag;  ///< Of the last success, however long ago.
  platform::TimePoint fetchTime;                 ///< Of the last attempt.
  FetchState fetchState = FetchState::Failure;
  std::int32_t maxAgeSeconds = 0;
  std::optional<std::string> version;  ///< Nothing after a failed attempt.
};

enum class StorebagDecision {
  Fetch,
  UseCached,        ///< The last success is young enough.
  WaitAfterFailure  ///< The last attempt failed a short while ago: what there is has to do.
};

/// Whether a request at `now` is served from the entry, null when there is none.
[[nodiscard]] StorebagDecision decideStorebag(const CachedStorebag* entry, platform::TimePoint now);

/// The storebags of one process, in memory only.
///
/// Threading: any thread. The lock is held for the look-ups alone, so that sessions which fetch at once do
/// not wait for each other; of two that fetch the same storebag the later one's result stays.
class StorebagCache {
 public:
  /// The shortest time between an attempt that failed and the next.
  static constexpr std::chrono::seconds kMinimumWaitAfterFailure{900};

  /// Borrows the platform.
  explicit StorebagCache(const platform::Platform& platform,
                         platform::FatalFailures fatalFailures = platform::FatalFailures::EndProcess)
      : _platform(platform), _fatalFailures(fatalFailures) {}

  /// The storebag, cached or fetched on the calling thread, which may block for up to 15 s. A client type
  /// without a storebag name is a fatal failure; where the process goes on, it never has a storebag.
  [[nodiscard]] std::optional<platform::Dictionary> storebag(std::uint32_t sessionID,
                                                             std::int32_t clientType);

  /// The version of the last attempt, when it succeeded. Never fetches.
  [[nodiscard]] std::optional<std::string> version(std::int32_t clientType) const;

  /// One attempt, and the entry brought up to date with it.
  void fetchAndCacheStorebag(std::int32_t clientType);

 private:
  std::optional<CachedStorebag> entry(std::optional<std::string_view> name) const;
  void store(std::string_view name, StorebagFetch fetch);

  const platform::Platform& _platform;
  const platform::FatalFailures _fatalFailures;
  mutable std::mutex _mutex;
  std::map<std::string, CachedStorebag, std::less<>> _entries;
};

}  // namespace tallyd
