// Shows the daemon's books and its tap to whoever may look.
#pragma once

#include <sys/types.h>

#include <memory>

#include "platform/IPC.h"

namespace tallyd::platform {
class Log;
}

namespace tallyd {

class Ledger;
class Tap;

/// Exports inspectionInterface() to root and to the daemon's own user; the connection of anybody else is
/// closed, with a line in the log. A connection's taps end with it.
///
/// Threading: any thread; each connection's calls run on its own queue.
class InspectionService final : public platform::ListenerDelegate {
 public:
  /// Borrows all three; they outlive every connection.
  /// @param ownUser  the daemon's effective user.
  InspectionService(platform::Log& log, Ledger& ledger, Tap& tap, uid_t ownUser)
      : _log(log), _ledger(ledger), _tap(tap), _ownUser(ownUser) {}

  bool shouldAcceptNewConnection(const std::shared_ptr<platform::ServiceConnection>& connection) override;

 private:
  platform::Log& _log;
  Ledger& _ledger;
  Tap& _tap;
  const uid_t _ownUser;
};

}  // namespace tallyd
