// A real HTTP or HTTPS server on the loopback interface, with a port that the system chooses.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "signing/CertificateAuthority.h"

namespace tallyd::test {

using Headers = std::vector<std::pair<std::string, std::string>>;

struct ReceivedRequest {
  std::string method;
  std::string target;  ///< Path and query, as sent.
  Headers headers;
  std::string body;  ///< Decoded, where a Content-Encoding said so.
  int remotePort = 0;

  /// The value of the first header of this name, in whatever case.
  [[nodiscard]] std::optional<std::string> header(const std::string& name) const;
};

struct ServedResponse {
  int status = 200;
  std::string body{};
  Headers headers{};
};

/// HTTP/1.1 with keep-alive. Keeps every request that it receives; answers with 200 and nothing unless a
/// handler answers.
///
/// Destroy the clients first: the server waits up to its keep-alive time of 5 s for connections that stay
/// open.
///
/// Threading: the handler runs on several threads at a time; everything else belongs to any thread.
class LoopbackServer {
 public:
  using Handler = std::function<ServedResponse(const ReceivedRequest&)>;

  explicit LoopbackServer(Handler handler = {});
  /// With TLS.
  explicit LoopbackServer(const signing::TLSIdentity& identity, Handler handler = {});
  ~LoopbackServer();
  LoopbackServer(const LoopbackServer&) = delete;
  LoopbackServer& operator=(const LoopbackServer&) = delete;

  [[nodiscard]] int port() const;
  /// "http://127.0.0.1:PORT" or "https://…", and the path.
  [[nodiscard]] std::string url(const std::string& path = "/") const;

  [[nodiscard]] std::vector<ReceivedRequest> requests() const;
  /// Waits until that many requests were received; false after 20 s.
  [[nodiscard]] bool waitForRequests(std::size_t count) const;
  /// How many different connections the requests came over.
  [[nodiscard]] std::size_t connectionCount() const;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

/// A certificate for 127.0.0.1 and localhost.
[[nodiscard]] signing::TLSIdentity loopbackIdentity(const signing::CertificateAuthority& authority);

}  // namespace tallyd::test
