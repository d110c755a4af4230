// Runs transfers as their sockets and times come due.
#pragma once

#include <curl/curl.h>

#include <chrono>
#include <optional>

#include "platform/FileDescriptor.h"
#include "platform/http/CurlHandles.h"

namespace tallyd::platform {

/// A multi handle with its sockets in an epoll set: a turn costs what has happened, however many transfers
/// wait.
///
/// Threading: one thread at a time, but wake() from any.
class TransferLoop {
 public:
  /// Throws std::system_error without descriptors, std::bad_alloc without memory.
  TransferLoop();
  TransferLoop(const TransferLoop&) = delete;
  TransferLoop& operator=(const TransferLoop&) = delete;

  [[nodiscard]] CURLM* multi() const { return _multi.get(); }

  /// Waits until a socket is ready, a time of libcurl's has come, wake() is called, or `longest` is over;
  /// then lets the transfers that are concerned go on.
  void turn(std::chrono::milliseconds longest);
  void wake() const;

 private:
  using Moment = std::chrono::steady_clock::time_point;

  static int onSocket(CURL* handle, curl_socket_t socket, int what, void* self, void* known);
  static int onTimer(CURLM* multi, long milliseconds, void* self);

  [[nodiscard]] int waitTime(std::chrono::milliseconds longest) const;
  bool actIfDue();
  void act(curl_socket_t socket, int events);
  void turnWithoutSockets(std::chrono::milliseconds longest);

  const FileDescriptor _epoll;
  const FileDescriptor _wakeUp;
  std::optional<Moment> _due;  ///< When libcurl wants to be called for its times.
  /// libcurl had no memory to name a socket: until no transfer is left it looks at all of them itself.
  bool _hasLostSockets = false;
  CurlMulti _multi;  ///< After what its callbacks use.
};

}  // namespace tallyd::platform
