// The socket that a named service listens on, and the lock that makes it the only one below a root.
#pragma once

#include <filesystem>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

/// Whom a service is for.
enum class SocketAccess {
  Everybody,   ///< Any local program may connect; the service manager may have passed the socket.
  OwnersOnly,  ///< A socket of mode 0600 that the process makes itself.
};

/// A listening Unix stream socket: the one that the service manager passed to this process, else a new one at
/// `path`, which takes the place of what a dead process left there. The destructor removes the new one's
/// file.
///
/// The lock file PATH.lock is held either way and stays behind, unlocked.
class ListeningSocket {
 public:
  /// Throws std::runtime_error when another process holds the lock, std::system_error for everything else.
  explicit ListeningSocket(const std::filesystem::path& path, SocketAccess access = SocketAccess::Everybody);
  ~ListeningSocket();
  ListeningSocket(const ListeningSocket&) = delete;
  ListeningSocket& operator=(const ListeningSocket&) = delete;

  [[nodiscard]] int descriptor() const { return _socket.get(); }

 private:
  const std::filesystem::path _path;
  FileDescriptor _lock;
  FileDescriptor _socket;
  bool _ownsFile = false;
};

}  // namespace tallyd::platform
