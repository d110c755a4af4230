// HTTP requests, waited for or handed to the one transfer engine.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/SerialQueue.h"
#include "platform/Value.h"

namespace tallyd::platform {

enum class CachePolicy {
  UseProtocol,         ///< Nothing is said about caches.
  ReloadIgnoringCache  ///< Caches on the way are told to fetch anew ("Cache-Control: no-cache", RFC 9111,
                       ///< section 5.2.1.4).
};

struct HTTPRequest {
  std::string url;
  std::string method = "GET";
  std::vector<std::pair<std::string, std::string>> headers;
  Data body;
  /// For the whole request; zero: none, but 60 s without progress end it.
  std::chrono::milliseconds timeout{0};
  CachePolicy cachePolicy = CachePolicy::UseProtocol;
  /// Asked on the request's queue before each further attempt of one that failed, if it is to have any; once
  /// it says no there is none, and the request fails as HTTPFailure::Withdrawn. Unset: yes.
  std::function<bool()> mayBeSentAgain{};
};

struct HTTPResponse {
  int status = 0;
  std::vector<std::pair<std::string, std::string>>
      headers;  ///< As received, of the last response when redirected.

  /// The values of all headers of this name, in whatever case, joined by ", " (RFC 9110, section 5.3);
  /// nothing without one.
  [[nodiscard]] std::optional<std::string> header(std::string_view name) const;
};

enum class HTTPFailure {
  Transfer,      ///< The request, or the way to its response, failed.
  Permanent,     ///< The request or what it leads to is at fault: the same request would fail again.
  TooMuchWaits,  ///< Nothing was tried: unfinished requests hold as much as they may.
  Withdrawn,     ///< It failed, and was not to be sent again.
};

/// What became of a request: an error, or a response and its body, which may be empty.
struct HTTPResult {
  std::optional<std::string> error;  ///< What went wrong, with the URL's host.
  std::optional<HTTPResponse> response;
  Data data;
  HTTPFailure failure = HTTPFailure::Transfer;  ///< Of what kind the error is.
};

/// Follows at most 10 redirects, within http and https only; trusts the system's certificate authorities and
/// those of "etc/tally/ca.pem". Response bodies above a limit of the implementation count as an error.
///
/// Threading: any thread.
class HTTPClient {
 public:
  using Completion = std::function<void(const HTTPResult& result)>;

  virtual ~HTTPClient() = default;

  /// Blocks until the request is done; marks the wait as a blocking call. A request for which memory runs out
  /// ends in an error like any other.
  [[nodiscard]] virtual HTTPResult sendSynchronousRequest(const HTTPRequest& request) = 0;

  /// Takes the request over and returns at once; `completion` runs on `queue`, exactly once. The bodies of
  /// unfinished requests are bounded: past the bound the request fails through its completion, and so it does
  /// when memory runs out on its way. The response's body is dropped.
  ///
  /// Throws std::bad_alloc when the request can't even be taken over: the completion does not run then.
  virtual void sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                                       Completion completion) = 0;
};

}  // namespace tallyd::platform
