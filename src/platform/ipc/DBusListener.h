// The daemon's named service: accepts clients on a Unix socket.
#pragma once

#include <filesystem>
#include <memory>

#include "platform/IPC.h"
#include "platform/ipc/ListeningSocket.h"

namespace tallyd::platform {

class Log;
class Queues;

/// Accepts on a serial queue of its own and gives each client's connection to the delegate.
///
/// When no descriptor or memory is left it says so in one critical line, pauses, and tries again until every
/// client that waits has been served; connections that exist go on meanwhile. Threading: setDelegate() and
/// resume() on one thread; the destructor waits for a delegate call that is under way.
class DBusListener final : public Listener {
 public:
  /// Makes the socket's folder and takes the socket (see ListeningSocket for what it throws). Borrows queues
  /// and log.
  DBusListener(const std::filesystem::path& socketPath, Queues& queues, Log& log,
               SocketAccess access = SocketAccess::Everybody);
  /// With a socket that was taken earlier, as a process does that may not listen any more.
  DBusListener(std::unique_ptr<const ListeningSocket> socket, Queues& queues, Log& log);
  ~DBusListener() override;
  DBusListener(const DBusListener&) = delete;
  DBusListener& operator=(const DBusListener&) = delete;

  void setDelegate(ListenerDelegate& delegate) override;
  void resume() override;

 private:
  class Acceptor;
  const std::shared_ptr<Acceptor> _acceptor;
};

}  // namespace tallyd::platform
