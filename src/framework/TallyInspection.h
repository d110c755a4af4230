// A program's look into the daemon: its books and its live tap.
#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd {

/// The daemon's books, or why there are none.
struct StatsReply {
  std::optional<std::string> error;
  platform::Dictionary stats;
};

/// A connection to the daemon's inspection socket, which takes root and the daemon's own user only.
///
/// Life cycle: connects at construction; what was tapped ends when the object is destroyed. Threading: any
/// thread; the handler runs on the connection's own and must not destroy this object.
class TallyInspection {
 public:
  static constexpr std::chrono::milliseconds kDefaultTimeout{60'000};

  /// Connects to the inspection socket. Throws std::system_error, naming the path, when it can't.
  explicit TallyInspection(const std::filesystem::path& socketPath,
                           std::chrono::milliseconds timeout = kDefaultTimeout);
  ~TallyInspection();
  TallyInspection(const TallyInspection&) = delete;
  TallyInspection& operator=(const TallyInspection&) = delete;

  /// Called once, when the daemon has closed the connection.
  void setInvalidationHandler(std::function<void()> handler);

  /// "connections": {"accepted", "open"}; "sessions": an array of dictionaries with "session", "sessionID",
  /// "clientType", maybe "clientName", "messages", "uploads" and "backends"; "sessionsNotShown"; "ended": the
  /// same sums over all sessions that have ended, and "sessions", their number; "total": over all.
  ///
  /// "messages" and "uploads", of what clients offered, and each backend, which has a "name" and a "kind",
  /// are counts: "accepted" is the sum of "sent", "held", "inFlight" and all of "dropped", which counts by
  /// reason.
  StatsReply statsSync();

  /// What went wrong, or nothing: from then on the daemon writes a JSON object a line to `output`, a pipe's
  /// writing end or a socket, which becomes non-blocking for all that share it. A reader that is too slow
  /// finds {"kind": "missed", "count": N} in place of what it missed.
  std::optional<std::string> tapSync(platform::FileDescriptor output);

 private:
  class Channel;
  std::unique_ptr<Channel> _channel;
};

}  // namespace tallyd
