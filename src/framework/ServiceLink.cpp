#include "framework/ServiceLink.h"

#include <algorithm>
#include <cstdint>
#include <system_error>
#include <utility>

namespace tallyd {

using std::chrono::milliseconds;

namespace {

constexpr const char* kClosed = "the connection was closed";
constexpr milliseconds kLongestTimeout{std::chrono::hours(24 * 365)};  ///< Beyond it times would overflow.
constexpr milliseconds kTimerPeriod{1'000};  ///< Of timers that are meant to fire once.

}  // namespace

std::string noAnswerText(milliseconds timeout) {
  return "no answer within " + std::to_string(timeout.count()) + " ms";
}

ServiceLink::ServiceLink(const TallyConnectionOptions& options, Environment environment)
    : _options(options), _environment(std::move(environment)), _schedule(options) {}

void ServiceLink::start() {
  _environment.queue->async([self = shared_from_this()] {
    self->_thread = std::this_thread::get_id();
    self->attempt();
  });
}

void ServiceLink::setHandler(Handler which, std::function<void()> newHandler) {
  _environment.queue->async([self = shared_from_this(), which, newHandler = std::move(newHandler)] {
    self->handler(which) = newHandler;
    if (which == Handler::Invalidation && newHandler && std::exchange(self->_invalidationDue, false))
      newHandler();
  });
}

bool ServiceLink::submit(ServiceRequest request, milliseconds timeout, ServiceCompletion completion) {
  if (_over) {
    if (completion) completion({TallyError::Closed, kClosed});
    return true;
  }
  if (_unfinished.fetch_add(1) >= _options.maximumCalls) {
    --_unfinished;
    if (completion) {
      _environment.queue->async([completion = std::move(completion), limit = _options.maximumCalls] {
        completion({TallyError::Refused, std::to_string(limit) + " calls are unfinished; no more are taken"});
      });
    }
    return false;
  }
  const auto patience = std::clamp(timeout, milliseconds::zero(), kLongestTimeout);
  // Work must be copyable, a descriptor is not.
  const auto call = std::make_shared<ServiceCall>(
      ServiceCall{std::move(request), _environment.now() + patience, patience, std::move(completion)});
  _environment.queue->async([self = shared_from_this(), call] { self->take(std::move(*call)); });
  return true;
}

// Calls

void ServiceLink::take(ServiceCall call) {
  if (_dead) return fail(call, TallyError::Closed, _problem);
  if (_closing && !_channel) return fail(call, TallyError::Closed, kClosed);
  if (_waiting.empty() && _accepted && !_finishing && _channel->isReady()) return send(std::move(call));
  if (_finishing) return fail(call, TallyError::Closed, kClosed);
  _waiting.add(std::move(call));
  watchDeadlines();
}

bool ServiceLink::sendWaiting() {
  bool sent = false;
  while (_channel && _accepted && _channel->isReady()) {
    auto call = _waiting.takeFirst();
    if (!call) break;
    send(std::move(*call));
    sent = true;
  }
  return sent;
}

void ServiceLink::send(ServiceCall call) {
  const auto left = std::chrono::ceil<milliseconds>(call.deadline - _environment.now());
  if (left <= milliseconds::zero()) return fail(call, TallyError::TimedOut, lateness(call));
  if (_options.reconnect != TallyReconnect::Never) _session.leaves(call.request);
  const auto channel = _channel;  // It may end meanwhile.
  if (!call.completion) {
    channel->call(std::move(call.request), left, {});
    --_unfinished;
    return;
  }
  channel->call(std::move(call.request), left,
                [self = shared_from_this(), timeout = call.timeout,
                 completion = std::move(call.completion)](ServiceReply reply) {
                  if (reply.kind == TallyError::None) self->_schedule.reset();
                  if (reply.kind == TallyError::TimedOut) reply.error = noAnswerText(timeout);
                  self->complete(completion, std::move(reply));
                });
}

void ServiceLink::complete(const ServiceCompletion& completion, ServiceReply reply) {
  --_unfinished;
  if (completion) completion(std::move(reply));
}

void ServiceLink::fail(ServiceCall& call, TallyError kind, const std::string& reason) {
  complete(call.completion, {kind, reason});
}

void ServiceLink::failWaiting(const std::string& reason) {
  for (auto& call : _waiting.takeAll()) fail(call, TallyError::Closed, reason);
  watchDeadlines();
}

void ServiceLink::expire() {
  for (auto& call : _waiting.takeExpired(_environment.now())) {
    fail(call, TallyError::TimedOut, lateness(call));
  }
  watchDeadlines();
  if (_closing) drain();
}

std::string ServiceLink::lateness(const ServiceCall& call) const {
  const std::string within = " within " + std::to_string(call.timeout.count()) + " ms";
  if (_accepted) return "the daemon took no call" + within;
  return "no connection to the daemon" + within + (_problem.empty() ? "" : ": " + _problem);
}

void ServiceLink::watchDeadlines() {
  const auto earliest = _waiting.earliestDeadline();
  if (!earliest) return _deadlineTimer.reset();
  // One that fires early does no harm; making one for each call would.
  if (_deadlineTimer && _watchedDeadline <= *earliest && _watchedDeadline > _environment.now()) return;
  _watchedDeadline = *earliest;
  const auto left = std::chrono::ceil<milliseconds>(*earliest - _environment.now());
  _deadlineTimer = _environment.queue->makeTimer(std::max(left, milliseconds::zero()), kTimerPeriod,
                                                 [self = shared_from_this()] { self->expire(); });
}

// Channels

void ServiceLink::attempt() {
  _retryTimer.reset();
  if (_closing || _dead) return;
  const auto generation = ++_generation;
  try {
    _channel = _environment.connect(
        {[self = shared_from_this(), generation] { return self->channelReady(generation); },
         [self = shared_from_this(), generation](bool within) { self->channelEnded(generation, within); }});
  } catch (const std::system_error& error) {
    _problem = error.what();
    return retryLater();
  }
  _problem = "the daemon does not accept it";
  // Where there is no other attempt, the calls' own deadlines are enough.
  if (_options.reconnect == TallyReconnect::Never) return;
  _acceptanceTimer =
      _environment.queue->makeTimer(_options.timeout, kTimerPeriod, [self = shared_from_this()] {
        if (const auto channel = self->_channel) channel->abort();
      });
}

void ServiceLink::retryLater() {
  const auto pause =
      _options.reconnect == TallyReconnect::Never ? std::nullopt : _schedule.next(_environment.draw());
  if (!pause) return invalidate();
  _retryTimer =
      _environment.queue->makeTimer(*pause, kTimerPeriod, [self = shared_from_this()] { self->attempt(); });
}

bool ServiceLink::channelReady(std::uint64_t generation) {
  if (generation != _generation || _finishing) return false;
  const bool first = !std::exchange(_accepted, true);
  if (first) configureAgain();
  const bool sent = sendWaiting();
  if (_closing) drain();
  return sent || first;
}

void ServiceLink::configureAgain() {
  _acceptanceTimer.reset();
  _problem.clear();
  const auto channel = _channel;  // It may end meanwhile.
  for (auto& request : _session.configuration()) {
    channel->call(std::move(request), _options.timeout,
                  [self = shared_from_this()](const ServiceReply& reply) {
                    if (reply.kind == TallyError::None) self->_schedule.reset();
                  });
  }
  if (std::exchange(_wasAccepted, true) && _channel) run(Handler::Reconnection);
}

void ServiceLink::channelEnded(std::uint64_t generation, bool withinMessage) {
  if (generation != _generation) return;
  _channel.reset();
  _acceptanceTimer.reset();
  const bool wasAccepted = std::exchange(_accepted, false);
  if (_closing) return markClosed();
  if (wasAccepted) _problem = "the connection to the daemon has ended";
  const bool again = _options.reconnect != TallyReconnect::Never;
  if (again ? wasAccepted : withinMessage) run(Handler::Interruption);
  retryLater();
}

void ServiceLink::invalidate() {
  _dead = true;
  failWaiting(_problem);
  _invalidationDue = !handler(Handler::Invalidation);
  run(Handler::Invalidation);
}

void ServiceLink::run(Handler which) {
  const auto copy = handler(which);  // It may be replaced while it runs.
  if (copy) copy();
}

// The end

void ServiceLink::close(milliseconds patience) {
  _environment.queue->async([self = shared_from_this()] { self->beginClose(); });
  std::unique_lock lock(_closedMutex);
  if (!_closedChanged.wait_for(lock, std::clamp(patience, milliseconds::zero(), kLongestTimeout),
                               [this] { return _closed; })) {
    lock.unlock();
    _environment.queue->async([self = shared_from_this()] { self->abandon(); });
    lock.lock();
    _closedChanged.wait(lock, [this] { return _closed; });
  }
  // What completions of the last moment have queued.
  _closed = false;
  lock.unlock();
  _environment.queue->async([self = shared_from_this()] {
    const std::lock_guard guard(self->_closedMutex);
    self->_closed = true;
    self->_closedChanged.notify_all();
  });
  lock.lock();
  _closedChanged.wait(lock, [this] { return _closed; });
}

void ServiceLink::beginClose() {
  _closing = true;
  _retryTimer.reset();
  if (!_channel) return markClosed();
  sendWaiting();
  drain();
}

/// Ends the channel as soon as nothing waits for it any more.
void ServiceLink::drain() {
  if (!_channel || _finishing || !_waiting.empty()) return;
  _finishing = true;
  const auto channel = _channel;  // It may end at once.
  if (_accepted) {
    channel->finish();
  } else {
    channel->abort();
  }
}

void ServiceLink::abandon() {
  _finishing = true;
  if (const auto channel = _channel) channel->abort();
}

void ServiceLink::markClosed() {
  _over = true;
  _dead = true;
  _problem = kClosed;
  failWaiting(kClosed);
  for (auto& each : _handlers) each = nullptr;
  const std::lock_guard lock(_closedMutex);
  _closed = true;
  _closedChanged.notify_all();
}

}  // namespace tallyd
