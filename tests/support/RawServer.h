// A TCP server on the loopback interface that does just what a test's script says, byte for byte.
#pragma once

#include <atomic>
#include <functional>
#include <list>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// What comes from a client, request by request.
class RequestReader {
 public:
  virtual ~RequestReader() = default;

  /// The bytes of one request, header and body (of its Content-Length); empty when the client has hung up.
  [[nodiscard]] std::string readRequest();
  /// Waits for the first bytes of a request and leaves them; false when the client has hung up.
  [[nodiscard]] bool waitForBytes() { return !_received.empty() || readMore(); }
  /// Waits until the client hangs up or the server goes away.
  void waitForClose();

 private:
  /// The next bytes, as they come; empty when the client has hung up.
  [[nodiscard]] virtual std::string nextBytes() = 0;
  [[nodiscard]] bool readMore();

  std::string _received;
};

/// One accepted connection, as the script sees it.
class RawConnection : public RequestReader {
 public:
  RawConnection(int descriptor, int number) : _descriptor(descriptor), _number(number) {}

  void write(std::string_view bytes);
  /// Closes the connection so that the client's next look at it is an error (TCP's RST).
  void reset() const;
  /// Which accepted connection this is, from 1.
  [[nodiscard]] int number() const { return _number; }
  [[nodiscard]] int descriptor() const { return _descriptor; }

 private:
  [[nodiscard]] std::string nextBytes() override;

  const int _descriptor;
  const int _number;
};

/// Runs the script once for each connection, each on a thread of its own, and closes the connection after it.
/// Destroying the server hangs up on every client.
class RawServer {
 public:
  using Script = std::function<void(RawConnection& connection)>;

  explicit RawServer(Script script);
  ~RawServer();
  RawServer(const RawServer&) = delete;
  RawServer& operator=(const RawServer&) = delete;

  [[nodiscard]] int port() const { return _port; }
  [[nodiscard]] std::string url(const std::string& path = "/") const;
  [[nodiscard]] int connectionCount() const { return _accepted; }

 private:
  struct Client {
    platform::FileDescriptor descriptor;
    std::thread thread;
  };
  void acceptClients();
  void runScript(Client& client, int number);

  const Script _script;
  platform::FileDescriptor _listener;
  int _port = 0;
  std::atomic<int> _accepted{0};
  std::mutex _mutex;
  std::list<Client> _clients;
  bool _stopping = false;
  std::thread _thread;
};

/// The size of the request that `bytes` starts with, header and body (of its Content-Length); nothing while
/// its header is not whole.
[[nodiscard]] std::optional<std::size_t> requestSize(std::string_view bytes);

/// A socket that listens on 127.0.0.1 at a port that the system chose.
[[nodiscard]] platform::FileDescriptor listenOnLoopback();
[[nodiscard]] int portOf(int socket);

}  // namespace tallyd::test
