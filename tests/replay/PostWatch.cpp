#include "replay/PostWatch.h"

#include <algorithm>
#include <string>

#include "platform/JSON.h"
#include "replay/Storebags.h"
#include "support/Gunzipped.h"

namespace tallyd::replay {

using platform::HTTPRequest;
using platform::HTTPResult;

namespace {

constexpr int kMostPostBackends = 2;  // "splunk" and "https_post".
constexpr const char* kNumberHeader = "Replay-Post";

/// The transfer failed on its way, or the server is too busy to take it (RFC 9110, section 15.6; RFC 6585,
/// section 4).
bool mayEndOtherwise(const HTTPResult& result) {
  if (result.error) return result.failure == platform::HTTPFailure::Transfer;
  const int status = result.response->status;
  return status == 429 || (status >= 502 && status <= 504);
}

bool isRefusal(const HTTPResult& result) { return !result.error && result.response->status >= 400; }

bool isWithdrawn(const HTTPResult& result) {
  return result.error && result.failure == platform::HTTPFailure::Withdrawn;
}

bool areAlike(const HTTPResult& one, const HTTPResult& other) {
  if (one.error || other.error) return one.error == other.error && one.failure == other.failure;
  return one.response->status == other.response->status;
}

std::string plainBody(const HTTPRequest& request) {
  const std::string_view body = request.body.bytes();
  return header(request, "Content-Encoding") == "gzip" ? test::gunzipped(body) : std::string(body);
}

}  // namespace

std::string header(const HTTPRequest& request, std::string_view name) {
  for (const auto& [key, value] : request.headers) {
    if (key == name) return value;
  }
  return {};
}

std::optional<platform::RetryLimits> retryLimitsOf(const OptIns& optIns) {
  if (optIns.retryPosts == 0) return std::nullopt;
  return platform::RetryLimits{.attempts = optIns.retryPosts};
}

PostWatch::PostWatch(Surroundings& surroundings)
    : _world(surroundings),
      _retries(retryLimitsOf(surroundings.optIns)),
      _asksForConsent(surroundings.optIns.consentChecks == ConsentChecks::BeforeEachPost) {}

std::uint64_t PostWatch::numberOf(const HTTPRequest& request) {
  return static_cast<std::uint64_t>(platform::leadingInteger(header(request, kNumberHeader)));
}

void PostWatch::begin(HTTPRequest& request) {
  const std::size_t events = takeDocument(request);
  ++_world.received.postsUnderWay;
  _world.received.eventsUnderWay += events;
  if (request.mayBeSentAgain && !_asksForConsent) _world.violated("a post asks for consent unasked");
  request.headers.emplace_back(kNumberHeader, std::to_string(++_lastNumber));
  _posts.emplace(_lastNumber, Post{_world.queues.now(), events, request.body});
}

std::size_t PostWatch::takeDocument(const HTTPRequest& request) {
  ++_world.received.posts;
  const std::string body = plainBody(request);
  _world.trace.write("post", "{} {}", request.url, body);
  const auto parsed = platform::valueFromJSON(body);
  const auto* document = parsed.value ? parsed.value->dictionary() : nullptr;
  if (!document) _world.violated("a post is no JSON document: " + parsed.error);
  const auto* events = document ? document->array("events") : nullptr;
  if (!events) return 0;
  std::map<std::string, int> ofMethod;
  for (const platform::Value& event : *events) {
    const auto* record = event.dictionary();
    if (++ofMethod[std::string(record->string("_method").value_or(""))] > kHighestEventThreshold + 1) {
      _world.violated("a batch had more events of one method than it may hold");
    }
    if (const auto serial = record->integer(kSerialKey))
      _world.arrived(Channel::Post, *serial, kMostPostBackends);
  }
  return events->size();
}

PostWatch::Post* PostWatch::find(const HTTPRequest& request) {
  const auto found = _posts.find(numberOf(request));
  if (found != _posts.end()) return &found->second;
  _world.violated("a post was tried after the daemon had heard what became of it");
  return nullptr;
}

void PostWatch::attempt(const HTTPRequest& request) {
  Post* post = find(request);
  if (!post) return;
  if (post->attempts > 0) checkFurtherAttempt(*post, request);
  ++post->attempts;
  post->isUnderWay = true;
}

void PostWatch::checkFurtherAttempt(const Post& post, const HTTPRequest& request) {
  ++_world.received.furtherAttempts;
  const Milliseconds now = _world.queues.now();
  _world.trace.write("attempt", "{} of a post of {} events", post.attempts + 1, post.events);
  if (!_retries || post.attempts > _retries->attempts) _world.violated("a post was tried too often");
  if (post.isUnderWay) return _world.violated("a post was tried while an attempt was under way");
  if (!mayEndOtherwise(post.last)) _world.violated("a post was tried again after an answer that stands");
  if (now < post.ended + post.asked) _world.violated("a post was tried again before the server wanted it");
  if (_retries && now > post.begun + _retries->totalTime) _world.violated("a post was tried again too late");
  if (request.body.bytes() != post.body.bytes()) _world.violated("a further attempt had another body");
  if (request.mayBeSentAgain && !_world.hasConsent)
    _world.violated("a post was tried again after consent had gone");
}

void PostWatch::attempted(const HTTPRequest& request, const HTTPResult& result,
                          std::chrono::seconds retryAfter) {
  Post* post = find(request);
  if (!post) return;
  post->isUnderWay = false;
  post->last = result;
  post->ended = _world.queues.now();
  post->asked = retryAfter;
}

void PostWatch::end(std::uint64_t number, const HTTPResult& result) {
  const auto found = _posts.find(number);
  if (found == _posts.end()) return _world.violated("the daemon heard twice what became of a post");
  checkEnd(found->second, result);
  count(found->second, result);
  _posts.erase(found);
}

void PostWatch::checkEnd(const Post& post, const HTTPResult& result) {
  if (post.attempts == 0) return _world.violated("a post ended that was never tried");
  if (post.isUnderWay) _world.violated("a post ended while an attempt was under way");
  if (isWithdrawn(result)) {
    if (!_asksForConsent || !mayEndOtherwise(post.last))
      _world.violated("a post was stopped without a cause");
    return;
  }
  if (!areAlike(result, post.last))
    _world.violated("the daemon heard another result than the last attempt's");
  if (mustBeTriedAgain(post)) _world.violated("a post was given up too early");
}

bool PostWatch::mustBeTriedAgain(const Post& post) const {
  if (!_retries || post.attempts > _retries->attempts || !mayEndOtherwise(post.last)) return false;
  Milliseconds longestWait = _retries->firstBackoff;
  for (unsigned i = 1; i < post.attempts; ++i) longestWait *= 2;
  longestWait = std::min(longestWait, _retries->longestBackoff);
  return post.ended - post.begun + post.asked + longestWait <= _retries->totalTime;
}

void PostWatch::count(const Post& post, const HTTPResult& result) {
  Received& received = _world.received;
  --received.postsUnderWay;
  received.eventsUnderWay -= post.events;
  if (isWithdrawn(result)) {
    received.eventsWithdrawn += post.events;
  } else if (result.error) {
    const bool foundNoRoom = result.failure == platform::HTTPFailure::TooMuchWaits;
    (foundNoRoom ? received.eventsWithoutRoom : received.eventsFailed) += post.events;
  } else {
    (isRefusal(result) ? received.eventsRefused : received.eventsTaken) += post.events;
    if (post.attempts > 1 && !isRefusal(result)) received.eventsSaved += post.events;
  }
}

void WatchedHTTP::sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                                          Completion completion) {
  _posts.begin(request);
  const std::uint64_t number = PostWatch::numberOf(request);
  _client.sendAsynchronousRequest(
      std::move(request), std::move(queue),
      [&posts = _posts, number, completion = std::move(completion)](const HTTPResult& result) {
        posts.end(number, result);
        completion(result);
      });
}

}  // namespace tallyd::replay
