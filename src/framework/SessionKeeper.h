// What a session was told of itself, so that a new one can be told again.
#pragma once

#include <optional>
#include <vector>

#include "framework/ServiceChannel.h"

namespace tallyd {

/// Follows the calls that leave and makes those that bring a new session into the same state: the last
/// session info, the last user info, the frameworks, the start.
///
/// A call counts once it leaves, whatever becomes of its answer: what it asked for is what the client wants.
/// A message with its own session info leaves nothing behind. Threading: one thread at a time.
class SessionKeeper {
 public:
  void leaves(const ServiceRequest& request);

  /// In their order; none for a session that was told nothing.
  [[nodiscard]] std::vector<ServiceRequest> configuration() const;

 private:
  void keepUserInfo(const platform::Value& wrapped);

  std::optional<std::vector<platform::Value>> _sessionInfo;  ///< The arguments of the last configuration.
  std::optional<platform::Value> _userInfo;                  ///< As it travels, the last that was one.
  bool _started = false;
};

}  // namespace tallyd
