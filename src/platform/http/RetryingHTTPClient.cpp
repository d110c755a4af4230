#include "platform/http/RetryingHTTPClient.h"

#include <fmt/format.h>

#include <mutex>
#include <new>
#include <unordered_set>
#include <utility>

#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Randomness.h"
#include "platform/http/CurlTransfer.h"
#include "platform/http/RequestBytes.h"

namespace tallyd::platform {

namespace {

std::string reasonOf(const HTTPRequest& request, const HTTPResult& result) {
  if (result.error) return *result.error;
  return fmt::format("status {} ({})", result.response->status, urlForMessages(request.url));
}

bool mayBeSentAgain(const HTTPRequest& request) {
  return !request.mayBeSentAgain || request.mayBeSentAgain();
}

/// The client below holds its own copy of all but the body, which is shared.
std::size_t heldBytesWithCopy(const HTTPRequest& request) {
  return 2 * heldBytesOf(request) - request.body.size();
}

}  // namespace

/// All requests that have not been completed. What the queues still have to do holds it.
class RetryingHTTPClient::Posts : public std::enable_shared_from_this<Posts> {
 public:
  Posts(HTTPClient& client, const Clock& clock, Randomness& randomness, Log& log, const RetryLimits& limits,
        Now now)
      : _client(client),
        _clock(clock),
        _randomness(randomness),
        _log(log),
        _limits(limits),
        _now(std::move(now)) {}

  void submit(HTTPRequest request, std::shared_ptr<SerialQueue> queue, Completion completion) {
    const std::size_t heldBytes = heldBytesWithCopy(request);
    const auto post = std::make_shared<Post>(
        Post{std::move(request), std::move(queue), std::move(completion), heldBytes, _now(), {}});
    const std::lock_guard lock(_mutex);
    if (heldBytes > _limits.maximumPendingBytes - _heldBytes) return refuse(post);
    attempt(post);
    _heldBytes += heldBytes;  // Now that it is taken. Its completion waits for the lock.
  }

  void close() {
    const std::lock_guard lock(_mutex);
    _isClosed = true;
    std::erase_if(_waiting, [](const SharedPost& post) { return tellLastResult(post); });
  }

 private:
  struct Post {
    const HTTPRequest request;
    const std::shared_ptr<SerialQueue> queue;
    const Completion completion;
    const std::size_t heldBytes;
    const Moment begun;
    HTTPResult lastResult;  ///< Of the last attempt, while it waits for the next.
    unsigned retries = 0;
  };
  using SharedPost = std::shared_ptr<Post>;

  static void tell(const SharedPost& post) {
    post->queue->async([post] { post->completion(post->lastResult); });
  }

  /// False when there is no memory for that: it is told when its wait is over.
  static bool tellLastResult(const SharedPost& post) {
    try {
      tell(post);
      return true;
    } catch (const std::bad_alloc&) {
      return false;
    }
  }

  void refuse(const SharedPost& post) const {
    post->lastResult = failedRequest(
        post->request,
        fmt::format("too many unfinished requests, which may hold {} bytes", _limits.maximumPendingBytes),
        HTTPFailure::TooMuchWaits);
    tell(post);
  }

  /// Under the lock: the client is not used any more once this is closed.
  void attempt(const SharedPost& post) {
    _client.sendAsynchronousRequest(
        post->request, post->queue,
        [self = shared_from_this(), post](const HTTPResult& result) { self->attempted(post, result); });
  }

  void attempted(const SharedPost& post, const HTTPResult& result) {
    if (!waitsForAnotherAttempt(post, result)) complete(*post, result);
  }

  void complete(const Post& post, const HTTPResult& result) {
    {
      const std::lock_guard lock(_mutex);
      _heldBytes -= post.heldBytes;
    }
    post.completion(result);
  }

  /// Without the memory for another attempt there is none.
  bool waitsForAnotherAttempt(const SharedPost& post, const HTTPResult& result) {
    try {
      return waitForAnotherAttempt(post, result);
    } catch (const std::bad_alloc&) {
      return false;
    }
  }

  bool waitForAnotherAttempt(const SharedPost& post, const HTTPResult& result) {
    if (!isWorthRetrying(result)) return false;
    const FailedAttempt failed{
        post->retries, std::chrono::ceil<std::chrono::milliseconds>(_now() - post->begun), _clock.now()};
    const auto wait = decideRetry(result, failed, uniformDraw(_randomness), _limits);
    if (!wait) return false;
    const std::string reason = reasonOf(post->request, result);
    if (!hold(post, result, *wait)) return false;
    asl_log(_log, LogLevel::Info, "Post failed, attempt {} of {} follows in {} ms: {}", post->retries + 1,
            _limits.attempts + 1, wait->count(), reason);
    return true;
  }

  /// False when nothing is tried again any more.
  bool hold(const SharedPost& post, const HTTPResult& result, std::chrono::milliseconds wait) {
    const std::lock_guard lock(_mutex);
    if (_isClosed) return false;
    post->lastResult = result;
    const auto waiting = _waiting.insert(post).first;
    try {
      post->queue->asyncAfter(wait, [self = shared_from_this(), post] { self->waited(post); });
    } catch (const std::bad_alloc&) {
      _waiting.erase(waiting);
      throw;
    }
    ++post->retries;
    return true;
  }

  void waited(const SharedPost& post) {
    if (!attemptAgain(post)) complete(*post, post->lastResult);
  }

  /// False when there can't be another attempt, and the post's last result says why it has failed.
  bool attemptAgain(const SharedPost& post) {
    {
      const std::lock_guard lock(_mutex);
      if (_waiting.erase(post) == 0) return true;  // It has been told already.
    }
    try {
      if (!mayBeSentAgain(post->request)) {
        post->lastResult = failedRequest(post->request, "not to be sent again", HTTPFailure::Withdrawn);
        return false;
      }
      const std::lock_guard lock(_mutex);
      if (_isClosed) return false;
      attempt(post);
      return true;
    } catch (const std::bad_alloc&) {
      post->lastResult = outOfMemory(post->request);
      return false;
    }
  }

  HTTPClient& _client;
  const Clock& _clock;
  Randomness& _randomness;
  Log& _log;
  const RetryLimits _limits;
  const Now _now;
  std::mutex _mutex;
  std::size_t _heldBytes = 0;
  std::unordered_set<SharedPost> _waiting;
  bool _isClosed = false;
};

RetryingHTTPClient::RetryingHTTPClient(HTTPClient& client, const Clock& clock, Randomness& randomness,
                                       Log& log, const RetryLimits& limits, Now now)
    : _client(client),
      _posts(std::make_shared<Posts>(client, clock, randomness, log, limits, std::move(now))) {}

RetryingHTTPClient::~RetryingHTTPClient() { _posts->close(); }

HTTPResult RetryingHTTPClient::sendSynchronousRequest(const HTTPRequest& request) {
  return _client.sendSynchronousRequest(request);
}

void RetryingHTTPClient::sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                                                 Completion completion) {
  _posts->submit(std::move(request), std::move(queue), std::move(completion));
}

}  // namespace tallyd::platform
