// The HTTP client on libcurl.
#pragma once

#include <memory>

#include "platform/HTTPClient.h"
#include "platform/Log.h"
#include "platform/Root.h"
#include "platform/SerialQueue.h"
#include "platform/http/HTTPLimits.h"

namespace tallyd::platform {

/// HTTP/1.1 and, over TLS, HTTP/2, with connections, TLS sessions and looked-up names reused.
///
/// All asynchronous requests of the process run on one thread, which starts with the first of them; making
/// the client starts none. A synchronous request runs on its caller's thread. Proxies are taken from the
/// environment ("https_proxy", "http_proxy", "no_proxy").
///
/// Trust: the system's certificate authorities and those of "/etc/tally/ca.pem" below the root, read once, at
/// the first TLS connection. That file may be missing; when it is broken, one line says so and the system's
/// alone count.
///
/// Requests: only the http and https schemes. A GET with a body is an error. Line feeds and other characters
/// that would end a header are sent as blanks (RFC 9110, section 5.5). The Content-Length is always the
/// body's own, sent once.
///
/// Destroying the client fails what is under way, through the completions; no synchronous request may then be
/// running.
class CurlHTTPClient : public HTTPClient {
 public:
  using Limits = HTTPLimits;

  /// Borrows `queues` and `log`; both must outlive this object.
  CurlHTTPClient(const Root& root, Queues& queues, Log& log, Limits limits = {});
  ~CurlHTTPClient() override;
  CurlHTTPClient(const CurlHTTPClient&) = delete;
  CurlHTTPClient& operator=(const CurlHTTPClient&) = delete;

  [[nodiscard]] HTTPResult sendSynchronousRequest(const HTTPRequest& request) override;
  void sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                               Completion completion) override;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace tallyd::platform
