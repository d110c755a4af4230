// When to try to connect again.
#pragma once

#include <chrono>
#include <optional>

#include "framework/TallyConnectionOptions.h"

namespace tallyd {

/// Pauses that grow from attempt to attempt. Threading: one thread at a time.
class ReconnectSchedule {
 public:
  using Milliseconds = std::chrono::milliseconds;

  /// Pauses below a millisecond are lengthened to one, a maximum below the first pause to the first pause.
  explicit ReconnectSchedule(const TallyConnectionOptions& options);

  /// The pause before the next attempt; nothing when there were enough.
  ///
  /// @param draw  random, in [0, 1): how much of the half that may be taken off is.
  [[nodiscard]] std::optional<Milliseconds> next(double draw);
  /// The service has answered.
  void reset();

 private:
  const Milliseconds _first;
  const Milliseconds _maximum;
  const std::optional<unsigned> _maximumAttempts;
  Milliseconds _pause;
  unsigned _attempts = 0;
};

}  // namespace tallyd
