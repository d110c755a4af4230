// What a session asks of whoever keeps the sessions.
#pragma once

#include <optional>
#include <string>

#include "platform/Value.h"

namespace tallyd {

class TallydSession;

/// Called synchronously on the session's queue, for many sessions at once.
class TallydSessionDelegate {
 public:
  virtual ~TallydSessionDelegate() = default;

  /// The storebag for the session's client type: backend name to profile. May block for a fetch.
  virtual std::optional<platform::Dictionary> storebagForSession(const TallydSession& session) = 0;
  virtual std::optional<std::string> storebagVersionForSession(const TallydSession& session) = 0;
  /// The combined session ID of the session one hierarchy level up among its correlated sessions.
  virtual std::optional<std::string> parentSessionIDStringForSession(const TallydSession& session) = 0;
  virtual void userInfoUpdatedForSession(TallydSession& session) = 0;

  [[nodiscard]] virtual std::string description() const = 0;
};

}  // namespace tallyd
