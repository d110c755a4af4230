// How a client's connection finds the daemon, how long it waits and what it does when the daemon goes away.
#pragma once

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <optional>

namespace tallyd {

/// What happens when the connection breaks, or cannot be made at first.
enum class TallyReconnect {
  Never,     ///< The connection is of no more use; one that cannot be made at first is an exception.
  WhenLost,  ///< It is made again, after growing pauses, and the session is configured as it was.
};

/// Where the daemon's socket is: below "/", or below the folder that the environment variable TALLY_ROOT
/// names (not in programs that run with raised rights).
[[nodiscard]] std::filesystem::path tallyDefaultSocketPath();

struct TallyConnectionOptions {
  using Milliseconds = std::chrono::milliseconds;

  /// Longer than a storebag fetch or an upload's stall.
  static constexpr Milliseconds kDefaultTimeout{60'000};

  std::filesystem::path socketPath = tallyDefaultSocketPath();

  /// How long each call that states no time of its own may take, waiting for the connection included.
  Milliseconds timeout = kDefaultTimeout;

  /// How long the destructor waits, at most, for calls that are under way; see TallyConnection.
  Milliseconds closeTimeout{5'000};

  TallyReconnect reconnect = TallyReconnect::WhenLost;

  /// The pause before the first attempt to connect again; each further one is twice as long, up to the
  /// maximum. Each is shortened by a random part, up to half of it, so that the clients of a daemon that
  /// comes back do not all come at once. An answer from the daemon sets the pause back.
  Milliseconds firstPause{100};
  Milliseconds maximumPause{30'000};

  /// So many attempts to connect again, in a row and without success, end the connection for good; nothing:
  /// it never gives up.
  std::optional<unsigned> maximumAttempts{};

  /// Calls that may be unfinished at a time, those that wait and those that are under way; further ones are
  /// refused.
  std::size_t maximumCalls = 4'096;
};

}  // namespace tallyd
