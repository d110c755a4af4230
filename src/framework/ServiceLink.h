// A client's lasting link to the service: calls that wait, one channel at a time, and a new one when it
// breaks.
#pragma once

#include <atomic>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "framework/ReconnectSchedule.h"
#include "framework/ServiceChannel.h"
#include "framework/SessionKeeper.h"
#include "framework/TallyConnectionOptions.h"
#include "framework/WaitingCalls.h"
#include "platform/SerialQueue.h"

namespace tallyd {

/// What a call says that left and got no answer in time.
[[nodiscard]] std::string noAnswerText(std::chrono::milliseconds timeout);

/// Passes calls to the channel in the order in which they were made, and completes each once: with its answer
/// or with the reason why there is none.
///
/// Calls that no channel took wait, at most until their deadline; those under way when a channel breaks fail
/// and are not sent again. Where reconnecting is asked for, a new channel is made after a pause, and hears
/// the session's configuration before anything else.
///
/// Bound: TallyConnectionOptions::maximumCalls. Threading: any thread, unless stated otherwise; completions
/// and handlers run on the queue.
class ServiceLink : public std::enable_shared_from_this<ServiceLink> {
 public:
  struct Environment {
    std::shared_ptr<platform::SerialQueue> queue;
    ServiceConnector connect;
    std::function<SteadyTime()> now;
    std::function<double()> draw;  ///< Random, in [0, 1); called on the queue.
  };
  enum class Handler {
    Interruption,  ///< The channel broke; within a message, where it is not made again.
    Invalidation,  ///< The link is of no more use. Once; when it is set late, at once.
    Reconnection,  ///< A channel was made again, and the session's configuration is on its way.
  };

  ServiceLink(const TallyConnectionOptions& options, Environment environment);

  /// Makes the first channel. Once.
  void start();
  void setHandler(Handler which, std::function<void()> handler);

  /// False when the call is refused because too many are unfinished; it is completed with the reason all the
  /// same.
  bool submit(ServiceRequest request, std::chrono::milliseconds timeout, ServiceCompletion completion);
  /// Whether the calling thread is the one that completions run on.
  [[nodiscard]] bool isOwnThread() const { return _thread == std::this_thread::get_id(); }

  /// Lets the calls that wait or are under way end while there is a channel, at most for `patience`, then
  /// fails the rest and ends the channel. Every completion has run when it returns; later calls fail.
  /// Once, not on the queue, and no other thread may submit any more.
  void close(std::chrono::milliseconds patience);

 private:
  // On the queue:
  void beginClose();
  void abandon();
  void markClosed();
  void drain();
  void attempt();
  void retryLater();
  bool channelReady(std::uint64_t generation);
  void channelEnded(std::uint64_t generation, bool withinMessage);
  void configureAgain();
  void take(ServiceCall call);
  bool sendWaiting();
  void send(ServiceCall call);
  void complete(const ServiceCompletion& completion, ServiceReply reply);
  void fail(ServiceCall& call, TallyError kind, const std::string& reason);
  void failWaiting(const std::string& reason);
  void expire();
  void watchDeadlines();
  void invalidate();
  void run(Handler which);
  [[nodiscard]] std::string lateness(const ServiceCall& call) const;
  std::function<void()>& handler(Handler which) { return _handlers[static_cast<std::size_t>(which)]; }

  const TallyConnectionOptions _options;
  const Environment _environment;
  std::atomic<std::size_t> _unfinished = 0;
  std::atomic<bool> _over = false;  ///< Nothing is queued any more: calls fail where they are made.
  std::atomic<std::thread::id> _thread{};

  // On the queue:
  std::shared_ptr<ServiceChannel> _channel;
  std::uint64_t _generation = 0;  ///< Of the channel; events of earlier ones are stale.
  bool _accepted = false;         ///< The service has accepted the channel.
  bool _wasAccepted = false;      ///< It has accepted one at some time.
  bool _dead = false;
  bool _invalidationDue = false;  ///< Nobody was there to hear it.
  bool _closing = false;
  bool _finishing = false;
  WaitingCalls _waiting;
  SessionKeeper _session;
  ReconnectSchedule _schedule;
  std::string _problem;  ///< Why there is no connection.
  std::unique_ptr<platform::Source> _retryTimer;
  std::unique_ptr<platform::Source> _acceptanceTimer;
  std::unique_ptr<platform::Source> _deadlineTimer;
  SteadyTime _watchedDeadline{};
  std::function<void()> _handlers[3];

  std::mutex _closedMutex;
  std::condition_variable _closedChanged;
  bool _closed = false;
};

}  // namespace tallyd
