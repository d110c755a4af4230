// An HTTP client that gives posts which failed further chances.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "platform/HTTPClient.h"
#include "platform/http/RetryPolicy.h"

namespace tallyd::platform {

class Clock;
class Log;
class Randomness;

/// Hands everything on to another client; an asynchronous request that fails is handed on again, as
/// decideRetry() says, unless it is not to be sent again any more, and its completion hears of the last
/// attempt only. Synchronous requests are not repeated.
///
/// A server may get twice what it had received when the transfer failed.
///
/// A request counts with its bytes from its first attempt to its completion, also while it waits; past
/// RetryLimits::maximumPendingBytes the newest one fails with HTTPFailure::TooMuchWaits. Waits are timed on
/// the request's own queue.
///
/// Life cycle: destroying it completes what waits with what the last attempt came to; what is under way gets
/// no further attempt. Threading: any thread.
class RetryingHTTPClient final : public HTTPClient {
 public:
  using Moment = std::chrono::steady_clock::time_point;
  using Now = std::function<Moment()>;

  /// Borrows the client, which must outlive this object, and the three others, which must outlive the
  /// requests' queues.
  RetryingHTTPClient(HTTPClient& client, const Clock& clock, Randomness& randomness, Log& log,
                     const RetryLimits& limits, Now now = &std::chrono::steady_clock::now);
  ~RetryingHTTPClient() override;
  RetryingHTTPClient(const RetryingHTTPClient&) = delete;
  RetryingHTTPClient& operator=(const RetryingHTTPClient&) = delete;

  [[nodiscard]] HTTPResult sendSynchronousRequest(const HTTPRequest& request) override;
  void sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                               Completion completion) override;

 private:
  class Posts;
  HTTPClient& _client;
  const std::shared_ptr<Posts> _posts;
};

}  // namespace tallyd::platform
