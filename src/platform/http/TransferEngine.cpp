#include "platform/http/TransferEngine.h"

#include <fmt/format.h>

#include <algorithm>
#include <exception>
#include <iterator>
#include <utility>

#include "platform/http/RequestBytes.h"

namespace tallyd::platform {

namespace {

using std::chrono::steady_clock;

/// How often waiting requests are looked over for those that have waited too long.
constexpr std::chrono::milliseconds kExpiryPeriod{1000};
/// With nothing to do the thread only waits to be woken; the figure bounds nothing.
constexpr int kIdlePollMs = 3'600'000;

}  // namespace

TransferEngine::Inbox::Answer TransferEngine::Inbox::add(WaitingRequest& request) {
  const std::lock_guard lock(_mutex);
  if (_closed) return Answer::Closed;
  if (request.client.heldBytes > _maximumBytes - _heldBytes) return Answer::Full;
  const std::size_t heldBytes = request.client.heldBytes;
  _requests.push_back(std::move(request));
  _heldBytes += heldBytes;
  return _requests.size() == 1 ? Answer::TakenAsFirst : Answer::Taken;
}

void TransferEngine::Inbox::takeAll(std::deque<WaitingRequest>& waiting) {
  std::vector<WaitingRequest> requests;
  {
    const std::lock_guard lock(_mutex);
    requests.swap(_requests);
  }
  std::move(requests.begin(), requests.end(), std::back_inserter(waiting));
}

void TransferEngine::Inbox::release(std::size_t bytes) {
  const std::lock_guard lock(_mutex);
  _heldBytes -= bytes;
}

void TransferEngine::Inbox::close() {
  const std::lock_guard lock(_mutex);
  _closed = true;
}

bool TransferEngine::Inbox::isClosed() const {
  const std::lock_guard lock(_mutex);
  return _closed;
}

TransferEngine::TransferEngine(const CurlEnvironment& environment, Log& log)
    : _environment(environment),
      _log(log),
      _inbox(environment.limits.maximumPendingBytes),
      _multi(curl_multi_init()),
      _pool(environment.limits.maximumIdleHandles) {
  const HTTPLimits& limits = environment.limits;
  curl_multi_setopt(_multi.get(), CURLMOPT_PIPELINING, static_cast<long>(CURLPIPE_MULTIPLEX));
  curl_multi_setopt(_multi.get(), CURLMOPT_MAX_HOST_CONNECTIONS,
                    static_cast<long>(limits.maximumConnectionsPerHost));
  curl_multi_setopt(_multi.get(), CURLMOPT_MAXCONNECTS, static_cast<long>(limits.maximumIdleConnections));
}

TransferEngine::~TransferEngine() {
  _inbox.close();
  curl_multi_wakeup(_multi.get());
  if (_thread.joinable()) _thread.join();
}

void TransferEngine::submit(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                            HTTPClient::Completion completion) {
  const auto patience = request.timeout.count() > 0 ? request.timeout : _environment.limits.stallTime;
  const std::size_t heldBytes = heldBytesOf(request);
  WaitingRequest waiting{
      std::move(request),
      {std::move(queue), std::move(completion), heldBytes, steady_clock::now() + patience}};
  const Inbox::Answer answer = _inbox.add(waiting);
  if (answer == Inbox::Answer::Taken) return;  // Whoever brought the first has woken the thread.
  if (answer == Inbox::Answer::TakenAsFirst) {
    std::call_once(_threadStarted, [this] { startThread(); });
    curl_multi_wakeup(_multi.get());
    return;
  }
  const std::string reason = answer == Inbox::Answer::Closed
                                 ? "HTTP transfers have ended"
                                 : fmt::format("too many unfinished requests, which may hold {} bytes",
                                               _environment.limits.maximumPendingBytes);
  HTTPResult result = failedRequest(waiting.request, reason);
  if (answer == Inbox::Answer::Full) result.failure = HTTPFailure::TooMuchWaits;
  waiting.client.heldBytes = 0;
  tell(std::move(waiting.client), std::move(result));
}

void TransferEngine::startThread() {
  _thread = std::thread([this] { threadMain(); });
}

void TransferEngine::threadMain() noexcept {
  std::string reason = "the HTTP client is going away";
  try {
    run();
  } catch (const std::exception& exception) {
    reason = exception.what();
    asl_log(_log, LogLevel::Critical, "HTTP transfers end: {}", reason);
  }
  _inbox.close();
  failUnfinished(reason);
}

void TransferEngine::run() {
  while (!_inbox.isClosed()) {
    startWaiting();
    int running = 0;
    curl_multi_perform(_multi.get(), &running);
    finishDone();
    expireLate();
    curl_multi_poll(_multi.get(), nullptr, 0, pollTimeoutMs(), nullptr);
  }
}

int TransferEngine::pollTimeoutMs() const {
  const bool canStart = !_waiting.empty() && _active.size() < _environment.limits.maximumActiveTransfers;
  if (canStart) return 0;
  return _active.empty() ? kIdlePollMs : static_cast<int>(kExpiryPeriod.count());
}

void TransferEngine::startWaiting() {
  _inbox.takeAll(_waiting);
  while (!_waiting.empty() && _active.size() < _environment.limits.maximumActiveTransfers) {
    WaitingRequest next = std::move(_waiting.front());
    _waiting.pop_front();
    start(std::move(next));
  }
}

void TransferEngine::start(WaitingRequest request) {
  auto transfer = std::make_unique<CurlTransfer>(_pool.take(), std::move(request.request),
                                                 CurlTransfer::ResponseBody::Drop, _environment);
  CURL* const handle = transfer->handle();
  std::optional<std::string> problem = transfer->prepare();
  if (!problem && curl_multi_add_handle(_multi.get(), handle) != CURLM_OK) problem = "out of memory";
  if (problem) {
    HTTPResult result = failedRequest(transfer->request(), *problem, HTTPFailure::Permanent);
    _pool.giveBack(transfer->releaseHandle());
    tell(std::move(request.client), std::move(result));
    return;
  }
  _active.emplace(handle, ActiveTransfer{std::move(transfer), std::move(request.client)});
}

void TransferEngine::finishDone() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(_multi.get(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    const CURLcode code = message->data.result;
    if (sendAgain(message->easy_handle, code)) continue;
    finish(message->easy_handle, [code](CurlTransfer& transfer) { return transfer.result(code); });
  }
}

bool TransferEngine::sendAgain(CURL* handle, CURLcode code) {
  if (!_active.at(handle).transfer->prepareSecondAttempt(code)) return false;
  curl_multi_remove_handle(_multi.get(), handle);
  return curl_multi_add_handle(_multi.get(), handle) == CURLM_OK;
}

/// libcurl's own times begin with a connection; this covers the wait for one.
void TransferEngine::expireLate() {
  const Moment now = steady_clock::now();
  if (now < _nextExpiry) return;
  _nextExpiry = now + kExpiryPeriod;
  constexpr const char* kReason = "no connection became free in time";

  std::vector<CURL*> late;
  for (const auto& [handle, active] : _active) {
    if (!active.transfer->hasStarted() && active.client.startBy + kExpiryPeriod < now) late.push_back(handle);
  }
  for (CURL* handle : late) {
    finish(handle, [](CurlTransfer& transfer) { return failedRequest(transfer.request(), kReason); });
  }
  std::deque<WaitingRequest> stillWaiting;
  for (WaitingRequest& waiting : _waiting) {
    if (waiting.client.startBy < now) {
      tell(std::move(waiting.client), failedRequest(waiting.request, kReason));
    } else {
      stillWaiting.push_back(std::move(waiting));
    }
  }
  _waiting.swap(stillWaiting);
}

void TransferEngine::finish(CURL* handle, const std::function<HTTPResult(CurlTransfer&)>& result) {
  const auto found = _active.find(handle);
  ActiveTransfer active = std::move(found->second);
  _active.erase(found);
  HTTPResult outcome = result(*active.transfer);
  curl_multi_remove_handle(_multi.get(), handle);
  _pool.giveBack(active.transfer->releaseHandle());
  active.transfer.reset();
  tell(std::move(active.client), std::move(outcome));
}

void TransferEngine::failUnfinished(const std::string& reason) {
  _inbox.takeAll(_waiting);
  while (!_active.empty()) {
    finish(_active.begin()->first,
           [&reason](CurlTransfer& transfer) { return failedRequest(transfer.request(), reason); });
  }
  for (WaitingRequest& waiting : _waiting) {
    tell(std::move(waiting.client), failedRequest(waiting.request, reason));
  }
  _waiting.clear();
}

void TransferEngine::tell(Client client, HTTPResult result) {
  _inbox.release(client.heldBytes);
  SerialQueue& queue = *client.queue;
  queue.async(
      [completion = std::move(client.completion), result = std::move(result)] { completion(result); });
}

}  // namespace tallyd::platform
