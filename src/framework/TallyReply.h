// What comes back from an operation of a client's connection.
#pragma once

#include <optional>
#include <string>

namespace tallyd {

/// Why a call has no value.
enum class TallyError {
  None,
  Argument,      ///< The arguments cannot be sent; nothing was.
  Refused,       ///< As many calls wait as the connection may hold; nothing was sent.
  TimedOut,      ///< No answer in time. The daemon may have heard the call, or hear it still, if it left.
  Disconnected,  ///< The connection broke while the call was under way; the daemon may have heard it.
  Closed,        ///< The connection is of no more use; nothing was sent.
  Rejected,      ///< The daemon answered with an error.
  OwnThread,     ///< A synchronous call from a completion or handler would wait for itself.
};

/// The value, or an error: its kind, and a text that says why.
template <class T>
struct TallyReply {
  std::optional<std::string> error;
  T value{};
  TallyError kind = TallyError::None;
};

}  // namespace tallyd
