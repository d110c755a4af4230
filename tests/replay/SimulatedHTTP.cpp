#include "replay/SimulatedHTTP.h"

#include <array>

#include "fakes/FakeHTTPClient.h"
#include "fakes/SignedStorebag.h"
#include "replay/Scenario.h"
#include "replay/Storebags.h"
#include "support/Gunzipped.h"

namespace tallyd::replay {

using fakes::StorebagSigner;
using platform::HTTPRequest;
using platform::HTTPResult;

namespace {

constexpr std::chrono::seconds kWaitAfterFailure{900};
constexpr const char* kRetryAfter = "Retry-After";

HTTPResult answer(int status, std::string body,
                  std::vector<std::pair<std::string, std::string>> headers = {}) {
  return {std::nullopt, platform::HTTPResponse{status, std::move(headers)}, platform::Data(std::move(body))};
}

/// "…/NAME?version=…".
std::string storebagName(const std::string& url) {
  const auto slash = url.rfind('/');
  return url.substr(slash + 1, url.find('?') - slash - 1);
}

/// How long the server wants to be left alone: only these two statuses say so.
std::chrono::seconds retryAfterOf(const HTTPResult& result) {
  if (result.error || (result.response->status != 429 && result.response->status != 503)) return {};
  return std::chrono::seconds(platform::leadingInteger(result.response->header(kRetryAfter).value_or("0")));
}

}  // namespace

HTTPResult SimulatedHTTP::sendSynchronousRequest(const HTTPRequest& request) {
  if (request.method == "GET") return storebag(request.url);
  return request.url.starts_with("https://dashboard") ? logData(request) : upload(request);
}

HTTPResult SimulatedHTTP::storebag(const std::string& url) {
  const std::string name = storebagName(url);
  if (!isStorebagName(name)) _world.violated("a storebag was fetched that no client type has: " + name);
  checkFetch(name);
  ++_world.received.fetches;
  _world.elapse(_world.upTo(_world.weather.longestFetch));
  Attempt attempt{{}, _world.draws.chance(_world.weather.fetchFails), 0};
  HTTPResult result = attempt.failed ? failedFetch(name) : envelope(name, attempt);
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
  _world.editionsTaken[name] = _world.edition;
  if (*cacheControl) result.response->headers.emplace_back("Cache-Control", cacheControl);
  return result;
}

HTTPResult SimulatedHTTP::failedFetch(const std::string& name) {
  constexpr double kFatalShare = 0.5;
  const bool isResilient = _world.optIns.fatalFailures == platform::FatalFailures::FailRequest;
  if (isResilient && _world.draws.chance(kFatalShare)) return fatalFetch(name);
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

HTTPResult SimulatedHTTP::fatalFetch(const std::string& name) {
  ++_world.received.fatalAnswers;
  const auto& server = StorebagSigner::server();
  if (_world.draws.chance(0.5))
    return answer(200, server.envelope(storebagWithoutVersion(name, _world.edition)));
  return answer(200, server.envelope(storebagNamed(name, _world.edition)),
                {{"Cache-Control", "private, max-age"}});
}

HTTPResult SimulatedHTTP::upload(const HTTPRequest& request) {
  _world.elapse(_world.upTo(_world.weather.longestUpload));
  const bool fails = _world.draws.chance(_world.weather.uploadFails);
  const bool refused = !fails && _world.draws.chance(_world.weather.uploadIsRefused);
  _world.trace.write("upload", "{} {} bytes: {}", request.url, test::gunzipped(request.body.bytes()).size(),
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
  _posts.attempt(request);
  const auto duration = _world.upTo(_world.weather.longestPost);
  queue->asyncAfter(duration, [this, request = std::move(request), completion = std::move(completion)] {
    const HTTPResult result = postResult(request.url);
    _posts.attempted(request, result, retryAfterOf(result));
    completion(result);
  });
}

HTTPResult SimulatedHTTP::postResult(const std::string& url) {
  if (_world.draws.chance(_world.weather.postFindsNoRoom)) {
    HTTPResult result = fakes::FakeHTTPClient::failure("too much waits");
    result.failure = platform::HTTPFailure::TooMuchWaits;
    return result;
  }
  // A session that needs no user info may have no server to post to.
  if (url.empty() || _world.draws.chance(_world.weather.postFails)) {
    constexpr double kPermanentShare = 0.1;
    HTTPResult result = fakes::FakeHTTPClient::failure("no way to the collector");
    if (url.empty() || _world.draws.chance(kPermanentShare))
      result.failure = platform::HTTPFailure::Permanent;
    return result;
  }
  return _world.draws.chance(_world.weather.postIsRefused) ? refusedPost() : answer(200, "");
}

HTTPResult SimulatedHTTP::refusedPost() {
  // The first four say that another attempt may end otherwise.
  constexpr std::array kStatuses{503, 429, 502, 504, 400, 413, 500};
  constexpr int kMostSeconds = 1200;  // More than a client that tries again has patience for.
  HTTPResult result = answer(_world.draws.pick(kStatuses), "");
  if (_world.draws.chance(0.3)) {
    result.response->headers.emplace_back(kRetryAfter, std::to_string(_world.draws.between(0, kMostSeconds)));
  }
  return result;
}

}  // namespace tallyd::replay
