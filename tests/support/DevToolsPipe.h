// A browser's debugging pipe: commands out, answers and events back.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd::test {

/// Speaks the DevTools protocol over two pipes: JSON texts, each with a NUL after it
/// (https://chromedevtools.github.io/devtools-protocol/).
///
/// Threading: one thread.
class DevToolsPipe {
 public:
  using EventHandler = std::function<void(const std::string& method, const platform::Dictionary& parameters)>;

  static constexpr std::chrono::seconds kPatience{60};  ///< For one answer.

  /// @param onEvent  Called during call(), for each event that came before its answer.
  DevToolsPipe(platform::FileDescriptor commands, platform::FileDescriptor answers, EventHandler onEvent);

  /// Sends a command and waits for its result. Throws std::runtime_error with the browser's own text when it
  /// refuses, when it ends, and when no answer comes in time.
  platform::Dictionary call(const std::string& method, const platform::Dictionary& parameters = {});

  /// Commands go to this session from now on; to the browser itself before.
  void setSession(std::string session) { _session = std::move(session); }

 private:
  void write(const std::string& text) const;
  [[nodiscard]] platform::Dictionary readMessage(std::chrono::steady_clock::time_point deadline);

  platform::FileDescriptor _commands;
  platform::FileDescriptor _answers;
  const EventHandler _onEvent;
  std::optional<std::string> _session;
  std::int64_t _lastId = 0;
  std::string _received;
};

}  // namespace tallyd::test
