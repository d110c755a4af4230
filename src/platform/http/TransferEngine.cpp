#include "platform/http/TransferEngine.h"

#include <fmt/format.h>

#include <algorithm>
#include <new>
#include <system_error>
#include <utility>

#include "platform/http/RequestBytes.h"

namespace tallyd::platform {

namespace {

using std::chrono::steady_clock;

/// How often waiting requests are looked over for those that have waited too long.
constexpr std::chrono::milliseconds kExpiryPeriod{1000};
/// How often the queues are offered the completions for which they had no memory.
constexpr std::chrono::milliseconds kTellAgainPeriod{100};
/// With nothing to do the thread only waits to be woken; the figure bounds nothing.
constexpr std::chrono::milliseconds kIdlePeriod = std::chrono::hours(1);

}  // namespace

TransferEngine::Inbox::Answer TransferEngine::Inbox::add(Jobs& job) {
  const std::lock_guard lock(_mutex);
  if (_closed) return Answer::Closed;
  const std::size_t heldBytes = job.front().heldBytes;
  if (heldBytes > _maximumBytes - _heldBytes) return Answer::Full;
  _jobs.splice(_jobs.end(), job);
  _heldBytes += heldBytes;
  return _jobs.size() == 1 ? Answer::TakenAsFirst : Answer::Taken;
}

void TransferEngine::Inbox::takeAll(Jobs& waiting) {
  const std::lock_guard lock(_mutex);
  waiting.splice(waiting.end(), _jobs);
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

TransferEngine::TransferEngine(const CurlEnvironment& environment)
    : _environment(environment),
      _inbox(environment.limits.maximumPendingBytes),
      _pool(environment.limits.maximumIdleHandles,
            [&environment](CURL* handle) { return CurlTransfer::configure(handle, environment); }) {
  const HTTPLimits& limits = environment.limits;
  curl_multi_setopt(_loop.multi(), CURLMOPT_PIPELINING, static_cast<long>(CURLPIPE_MULTIPLEX));
  curl_multi_setopt(_loop.multi(), CURLMOPT_MAX_HOST_CONNECTIONS,
                    static_cast<long>(limits.maximumConnectionsPerHost));
  curl_multi_setopt(_loop.multi(), CURLMOPT_MAXCONNECTS, static_cast<long>(limits.maximumIdleConnections));
}

TransferEngine::~TransferEngine() {
  _inbox.close();
  _loop.wake();
  if (_thread.joinable()) _thread.join();
}

void TransferEngine::submit(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                            HTTPClient::Completion completion) {
  const auto patience = request.timeout.count() > 0 ? request.timeout : _environment.limits.stallTime;
  const std::size_t heldBytes = heldBytesOf(request);
  Jobs job;
  job.push_back({std::move(request), std::move(queue),
                 std::make_shared<Outcome>(Outcome{std::move(completion), {}}), heldBytes,
                 steady_clock::now() + patience});
  if (!hasThread()) return refuse(job.front(), "no thread for HTTP transfers", HTTPFailure::Transfer);
  switch (_inbox.add(job)) {
    case Inbox::Answer::TakenAsFirst:
      _loop.wake();
      return;
    case Inbox::Answer::Taken:
      return;  // Whoever brought the first has woken the thread.
    case Inbox::Answer::Full:
      return refuse(job.front(),
                    fmt::format("too many unfinished requests, which may hold {} bytes",
                                _environment.limits.maximumPendingBytes),
                    HTTPFailure::TooMuchWaits);
    case Inbox::Answer::Closed:
      return refuse(job.front(), "HTTP transfers have ended", HTTPFailure::Transfer);
  }
}

/// A thread that can't be had is tried for again with the next request.
bool TransferEngine::hasThread() {
  const std::lock_guard lock(_threadMutex);
  if (_thread.joinable()) return true;
  try {
    _thread = std::thread([this] { run(); });
    return true;
  } catch (const std::system_error&) {
    return false;
  }
}

void TransferEngine::refuse(Job& job, const std::string& reason, HTTPFailure kind) {
  job.outcome->result = failedRequest(job.request, reason, kind);
  tell(job);
}

/// Nothing but a request's own handling takes memory here.
void TransferEngine::run() noexcept {
  while (!_inbox.isClosed()) {
    startWaiting();
    _loop.turn(patience());
    finishDone();
    expireLate();
    tellSettled();
  }
  failUnfinished();
}

/// Until it is time to look at something else than the transfers.
std::chrono::milliseconds TransferEngine::patience() const {
  if (!_settled.empty()) return kTellAgainPeriod;
  return _active.empty() && _waiting.empty() ? kIdlePeriod : kExpiryPeriod;
}

void TransferEngine::startWaiting() {
  _inbox.takeAll(_waiting);
  while (!_waiting.empty() && _active.size() < _environment.limits.maximumActiveTransfers)
    start(_waiting.begin());
}

void TransferEngine::start(Jobs::iterator job) {
  std::optional<std::string> problem;
  try {
    problem = prepare(*job);
  } catch (const std::bad_alloc&) {
    return settle(_waiting, job, &outOfMemory);
  }
  if (problem) {
    return settle(_waiting, job, [&problem](const HTTPRequest& request) {
      return failedRequest(request, *problem, HTTPFailure::Permanent);
    });
  }
  _active.splice(_active.end(), _waiting, job);
}

std::optional<std::string> TransferEngine::prepare(Job& job) {
  job.transfer = std::make_unique<CurlTransfer>(_pool.take(), std::move(job.request),
                                                CurlTransfer::ResponseBody::Drop, _environment);
  if (auto problem = job.transfer->prepare()) return problem;
  if (curl_multi_add_handle(_loop.multi(), job.transfer->handle()) != CURLM_OK) throw std::bad_alloc();
  return std::nullopt;
}

void TransferEngine::finishDone() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(_loop.multi(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    const CURLcode code = message->data.result;
    CURL* const handle = message->easy_handle;
    const auto job = std::find_if(_active.begin(), _active.end(),
                                  [handle](const Job& each) { return each.transfer->handle() == handle; });
    CurlTransfer& transfer = *job->transfer;
    if (sendAgain(handle, code, transfer)) continue;
    settle(_active, job, [&transfer, code](const HTTPRequest&) { return transfer.result(code); });
  }
}

bool TransferEngine::sendAgain(CURL* handle, CURLcode code, CurlTransfer& transfer) {
  if (!transfer.prepareSecondAttempt(code)) return false;
  curl_multi_remove_handle(_loop.multi(), handle);
  return curl_multi_add_handle(_loop.multi(), handle) == CURLM_OK;
}

/// libcurl's own times begin with a connection; this covers the wait for one.
void TransferEngine::expireLate() {
  const Moment now = steady_clock::now();
  if (now < _nextExpiry) return;
  _nextExpiry = now + kExpiryPeriod;
  settleLate(_active, [now](const Job& job) {
    return !job.transfer->hasStarted() && job.startBy + kExpiryPeriod < now;
  });
  settleLate(_waiting, [now](const Job& job) { return job.startBy < now; });
}

template <class IsLate>
void TransferEngine::settleLate(Jobs& jobs, const IsLate& isLate) {
  for (auto next = jobs.begin(); next != jobs.end();) {
    const auto job = next++;
    if (!isLate(*job)) continue;
    settle(jobs, job, [](const HTTPRequest& request) {
      return failedRequest(request, "no connection became free in time");
    });
  }
}

template <class MakeResult>
void TransferEngine::settle(Jobs& from, Jobs::iterator job, const MakeResult& makeResult) {
  const HTTPRequest& request = job->transfer ? job->transfer->request() : job->request;
  HTTPResult& result = job->outcome->result;
  try {
    result = makeResult(request);
  } catch (const std::bad_alloc&) {
    result = outOfMemory(request);
  }
  if (job->transfer) {
    curl_multi_remove_handle(_loop.multi(), job->transfer->handle());
    if (job->transfer->mayReuseHandle()) _pool.giveBack(job->transfer->releaseHandle());
    job->transfer.reset();
  }
  job->request = {};
  _inbox.release(job->heldBytes);
  _settled.splice(_settled.end(), from, job);
}

void TransferEngine::failUnfinished() {
  const auto goingAway = [](const HTTPRequest& request) {
    return failedRequest(request, "the HTTP client is going away");
  };
  _inbox.takeAll(_waiting);
  for (Jobs* jobs : {&_active, &_waiting}) {
    while (!jobs->empty()) settle(*jobs, jobs->begin(), goingAway);
  }
  for (tellSettled(); !_settled.empty(); tellSettled()) _loop.turn(kTellAgainPeriod);
}

/// In order. The first for which its queue has no memory stays, and what is behind it.
void TransferEngine::tellSettled() {
  try {
    for (; !_settled.empty(); _settled.pop_front()) tell(_settled.front());
  } catch (const std::bad_alloc&) {
    return;
  }
}

void TransferEngine::tell(const Job& job) {
  job.queue->async([outcome = job.outcome] {
    // What the completion holds goes here, and not wherever the last one lets go of the outcome.
    const auto completion = std::exchange(outcome->completion, nullptr);
    completion(outcome->result);
  });
}

}  // namespace tallyd::platform
