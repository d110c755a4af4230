// A TLS server on the loopback interface that does just what a test's script says.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "signing/CertificateAuthority.h"
#include "support/RawServer.h"

namespace tallyd::test {

/// One connection after its handshake, as the script sees it.
class TLSConnection : public RequestReader {
 public:
  /// Takes part in the handshake.
  TLSConnection(RawConnection& connection, void* context);
  ~TLSConnection() override;
  TLSConnection(const TLSConnection&) = delete;
  TLSConnection& operator=(const TLSConnection&) = delete;

  void write(std::string_view bytes) { static_cast<void>(writeAll(bytes)); }
  /// False when the client has hung up.
  [[nodiscard]] bool writeAll(std::string_view bytes);
  /// Says that nothing more comes (RFC 8446, section 6.1) and closes the connection.
  void close();
  /// Closes the connection without a word (TCP's RST).
  void reset() const { _connection.reset(); }
  /// Which accepted connection this is, from 1.
  [[nodiscard]] int number() const { return _connection.number(); }

 private:
  [[nodiscard]] std::string nextBytes() override;

  struct Session;
  RawConnection& _connection;
  const std::unique_ptr<Session> _session;
};

/// Runs the script once for each connection whose handshake succeeds, each on a thread of its own.
/// Destroying the server hangs up on every client.
class TLSServer {
 public:
  using Script = std::function<void(TLSConnection& connection)>;

  TLSServer(const signing::TLSIdentity& identity, Script script);
  ~TLSServer();
  TLSServer(const TLSServer&) = delete;
  TLSServer& operator=(const TLSServer&) = delete;

  /// What connections from now on are shown.
  void setIdentity(const signing::TLSIdentity& identity);

  [[nodiscard]] std::string url(const std::string& path = "/") const;
  [[nodiscard]] int connectionCount() const { return _server->connectionCount(); }

 private:
  struct Context;
  [[nodiscard]] std::shared_ptr<const Context> context() const;

  mutable std::mutex _mutex;
  std::shared_ptr<const Context> _context;
  std::unique_ptr<RawServer> _server;
};

}  // namespace tallyd::test
