// The tool's session with the daemon.
#pragma once

#include <atomic>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "framework/TallyConnection.h"
#include "tallyctl/Options.h"
#include "tallyctl/SessionInfo.h"

namespace tallyd::tallyctl {

/// The command cannot go on; the text says why and names what is at fault.
class Failure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

using Strings = TallyConnection::Strings;

/// A connection whose failed calls end the command. Threading: one thread, but for lost().
class Session {
 public:
  /// Connects. Throws std::system_error that names the socket.
  explicit Session(const ConnectionOptions& options);
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  TallyConnection& connection() { return _connection; }
  [[nodiscard]] bool lost() const { return _lost; }  ///< The daemon has gone; no further call can succeed.

  /// Configures and starts the session; what comes back are the names of the backends that report, or nothing
  /// when there is no storebag. Throws Failure.
  std::optional<Strings> start(const SessionOptions& options, std::uint32_t sessionID,
                               std::optional<platform::Dictionary> userInfo);

  /// The answer's value. Throws Failure, which names the socket and `operation`, when there is no answer.
  template <class T>
  T answer(std::string_view operation, TallyReply<T> reply) const {
    if (reply.error) fail(operation, *reply.error);
    return std::move(reply.value);
  }

  [[nodiscard]] std::string lostText() const;

 private:
  [[noreturn]] void fail(std::string_view operation, std::string_view error) const;

  const std::string _socket;
  std::atomic<bool> _lost = false;
  TallyConnection _connection;  ///< Last, as its thread sets the flag.
};

}  // namespace tallyd::tallyctl
