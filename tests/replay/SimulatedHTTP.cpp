#include "replay/SimulatedHTTP.h"

#include <zlib.h>

#include <array>

#include "fakes/FakeHTTPClient.h"
#include "fakes/SignedStorebag.h"
#include "platform/JSON.h"
#include "replay/Scenario.h"
#include "replay/Storebags.h"

namespace tallyd::replay {

using fakes::StorebagSigner;
using platform::HTTPRequest;
using platform::HTTPResult;

namespace {

constexpr std::chrono::seconds kWaitAfterFailure{900};
constexpr int kMostPostBackends = 2;  // "splunk" and "https_post".

HTTPResult answer(int status, std::string body,
                  std::vector<std::pair<std::string, std::string>> headers = {}) {
  return {std::nullopt, platform::HTTPResponse{status, std::move(headers)}, platform::Data(std::move(body))};
}

std::string header(const HTTPRequest& request, std::string_view name) {
  for (const auto& [key, value] : request.headers) {
    if (key == name) return value;
  }
  return {};
}

std::string gunzipped(std::string_view compressed) {
  constexpr int kGzip = 15 + 16;  // zlib.h: the largest window, with a gzip header.
  std::string plain(1 << 20, '\0');
  z_stream stream{};
  if (inflateInit2(&stream, kGzip) != Z_OK) return {};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  stream.next_out = reinterpret_cast<Bytef*>(plain.data());
  stream.avail_out = static_cast<uInt>(plain.size());
  inflate(&stream, Z_FINISH);
  plain.resize(stream.total_out);
  inflateEnd(&stream);
  return plain;
}

std::string plainBody(const HTTPRequest& request) {
  const std::string_view body = request.body.bytes();
  return header(request, "Content-Encoding") == "gzip" ? gunzipped(body) : std::string(body);
}

/// "…/NAME?version=…".
std::string storebagName(const std::string& url) {
  const auto slash = url.rfind('/');
  return url.substr(slash + 1, url.find('?') - slash - 1);
}

}  // namespace

HTTPResult SimulatedHTTP::sendSynchronousRequest(const HTTPRequest& request) {
  if (request.method == "GET") return storebag(request.url);
  return request.url.starts_with("https://dashboard") ? logData(request) : upload(request);
}

HTTPResult SimulatedHTTP::storebag(const std::string& url) {
  const std::string name = storebagName(url);
  checkFetch(name);
  ++_world.received.fetches;
  _world.elapse(_world.upTo(_world.weather.longestFetch));
  Attempt attempt{{}, _world.draws.chance(_world.weather.fetchFails), 0};
  HTTPResult result = attempt.failed ? failedFetch() : envelope(name, attempt);
  attempt.ended = _world.clock.now();
  _attempts[name] = attempt;
  if (attempt.failed) ++_world.received.fetchesFailed;
  _world.trace.write("fetch", "{} {}", url,
                     attempt.failed ? "failed" : "max-age " + std::to_string(attempt.maxAgeSeconds));
  return result;
}

void SimulatedHTTP::checkFetch(const std::string& name) {
  const auto last = _attempts.find(name);
  if (last == _attempts.end()) return;
  const auto age = std::chrono::abs(_world.clock.now() - last->second.ended);
  const auto least =
      last->second.failed ? kWaitAfterFailure : std::chrono::seconds(last->second.maxAgeSeconds);
  if (age < least) _world.violated("storebag " + name + " was fetched again too early");
}

HTTPResult SimulatedHTTP::envelope(const std::string& name, Attempt& attempt) {
  const std::array<std::pair<const char*, int>, 8> kAges{{{"max-age=60", 60},
                                                          {"max-age=120", 120},
                                                          {"private, max-age=300", 300},
                                                          {"max-age=600", 600},
                                                          {"private, max-age=900", 900},
                                                          {"max-age=7200", 7200},
                                                          {"no-cache", 86'400},
                                                          {"", 0}}};
  const auto& [cacheControl, seconds] = _world.draws.pick(kAges);
  attempt.maxAgeSeconds = seconds;
  HTTPResult result = answer(200, StorebagSigner::server().envelope(storebagNamed(name, _world.edition)));
  if (*cacheControl) result.response->headers.emplace_back("Cache-Control", cacheControl);
  return result;
}

HTTPResult SimulatedHTTP::failedFetch() {
  switch (_world.draws.between(0, 4)) {
    case 0:
      return answer(503, "<html>Busy</html>", {{"Cache-Control", "max-age=60"}});
    case 1:
      return answer(200, StorebagSigner::stranger().envelope(storebagNamed("playhall", _world.edition)));
    case 2:
      return answer(200, StorebagSigner::server().envelope(storebagWithoutSections()));
    case 3:
      return answer(200, "");
    default:
      return fakes::FakeHTTPClient::failure("no way to the storebag server");
  }
}

HTTPResult SimulatedHTTP::upload(const HTTPRequest& request) {
  _world.elapse(_world.upTo(_world.weather.longestUpload));
  const bool fails = _world.draws.chance(_world.weather.uploadFails);
  const bool refused = !fails && _world.draws.chance(_world.weather.uploadIsRefused);
  _world.trace.write("upload", "{} {} bytes: {}", request.url, gunzipped(request.body.bytes()).size(),
                     fails     ? "failed"
                     : refused ? "refused"
                               : "taken");
  if (fails) ++_world.received.uploadsFailed;
  if (fails) return fakes::FakeHTTPClient::failure("no way to the upload server");
  ++_world.received.uploads;
  if (!refused) return answer(200, R"({"status":"success"})");
  ++_world.received.uploadsRefused;
  return answer(500, "no");
}

HTTPResult SimulatedHTTP::logData(const HTTPRequest& request) {
  _world.elapse(_world.upTo(_world.weather.longestUpload));
  const bool fails = _world.draws.chance(_world.weather.uploadFails);
  const bool refused = !fails && _world.draws.chance(_world.weather.uploadIsRefused);
  _world.trace.write("log-data", "{} {} bytes: {}", request.url, request.body.size(),
                     fails     ? "failed"
                     : refused ? "refused"
                               : "taken");
  if (fails) ++_world.received.logDataFailed;
  if (fails) return fakes::FakeHTTPClient::failure("no way to the dashboard");
  ++_world.received.logData;
  if (refused) ++_world.received.logDataRefused;
  return answer(refused ? 413 : 200, "log-data/" + std::to_string(_world.received.logData));
}

void SimulatedHTTP::sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                                            Completion completion) {
  const std::size_t events = takePost(request);
  _world.received.eventsUnderWay += events;
  queue->asyncAfter(_world.upTo(_world.weather.longestPost),
                    [this, url = request.url, events, completion = std::move(completion)] {
                      completion(postResult(url, events));
                    });
}

std::size_t SimulatedHTTP::takePost(const HTTPRequest& request) {
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

HTTPResult SimulatedHTTP::postResult(const std::string& url, std::size_t events) {
  Received& received = _world.received;
  received.eventsUnderWay -= events;
  if (_world.draws.chance(_world.weather.postFindsNoRoom)) {
    received.eventsWithoutRoom += events;
    HTTPResult result = fakes::FakeHTTPClient::failure("too much waits");
    result.failure = platform::HTTPFailure::TooMuchWaits;
    return result;
  }
  // A session that needs no user info may have no server to post to.
  if (url.empty() || _world.draws.chance(_world.weather.postFails)) {
    received.eventsFailed += events;
    return fakes::FakeHTTPClient::failure("no way to the collector");
  }
  const bool refused = _world.draws.chance(_world.weather.postIsRefused);
  (refused ? received.eventsRefused : received.eventsTaken) += events;
  return answer(refused ? 503 : 200, "");
}

}  // namespace tallyd::replay
