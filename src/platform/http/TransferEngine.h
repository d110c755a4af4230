// The thread on which all asynchronous HTTP requests of the process run.
#pragma once

#include <chrono>
#include <list>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

#include "platform/HTTPClient.h"
#include "platform/http/CurlHandles.h"
#include "platform/http/CurlTransfer.h"
#include "platform/http/TransferLoop.h"

namespace tallyd::platform {

/// Takes requests and tells each one's completion, on its own queue and exactly once, what became of it.
///
/// The thread starts with the first request. A bounded number of requests is in libcurl's hands, the others
/// wait in order of arrival; what all of them hold together is bounded too. Destroying the engine fails what
/// is unfinished and waits for the thread.
///
/// Memory that runs out fails the request that needed it, and no other. What it takes to keep a request and
/// to tell its end is there before it is taken; only the queue's record of the completion is not, and is
/// asked for until it can be had.
///
/// Threading: any thread may submit.
class TransferEngine {
 public:
  /// Borrows the environment.
  explicit TransferEngine(const CurlEnvironment& environment);
  ~TransferEngine();
  TransferEngine(const TransferEngine&) = delete;
  TransferEngine& operator=(const TransferEngine&) = delete;

  /// Throws std::bad_alloc when it can't even be taken; its completion is not called then.
  void submit(HTTPRequest request, std::shared_ptr<SerialQueue> queue, HTTPClient::Completion completion);

 private:
  using Moment = std::chrono::steady_clock::time_point;

  /// What a completion is called with, and when.
  struct Outcome {
    HTTPClient::Completion completion;
    HTTPResult result;
  };
  /// One request, from its arrival until its completion is on its queue.
  struct Job {
    HTTPRequest request;  ///< Until there is a transfer, which has it then.
    std::shared_ptr<SerialQueue> queue;
    std::shared_ptr<Outcome> outcome;
    std::size_t heldBytes;
    Moment startBy;  ///< When it must have found a connection.
    std::unique_ptr<CurlTransfer> transfer{};
  };
  using Jobs = std::list<Job>;  ///< From one to another they move without memory.

  /// What submitters and the thread share.
  class Inbox {
   public:
    enum class Answer { TakenAsFirst, Taken, Full, Closed };
    explicit Inbox(std::size_t maximumBytes) : _maximumBytes(maximumBytes) {}

    [[nodiscard]] Answer add(Jobs& job);  ///< Moves the one job out when it is taken.
    void takeAll(Jobs& waiting);
    void release(std::size_t bytes);
    void close();
    [[nodiscard]] bool isClosed() const;

   private:
    const std::size_t _maximumBytes;
    mutable std::mutex _mutex;
    Jobs _jobs;
    std::size_t _heldBytes = 0;
    bool _closed = false;
  };

  [[nodiscard]] bool hasThread();
  static void refuse(Job& job, const std::string& reason, HTTPFailure kind);
  void run() noexcept;
  void startWaiting();
  void start(Jobs::iterator job);
  [[nodiscard]] std::optional<std::string> prepare(Job& job);
  void finishDone();
  [[nodiscard]] bool sendAgain(CURL* handle, CURLcode code, CurlTransfer& transfer);
  void expireLate();
  template <class IsLate>
  void settleLate(Jobs& jobs, const IsLate& isLate);
  template <class MakeResult>
  void settle(Jobs& from, Jobs::iterator job, const MakeResult& makeResult);
  void failUnfinished();
  void tellSettled();
  static void tell(const Job& job);
  [[nodiscard]] std::chrono::milliseconds patience() const;

  const CurlEnvironment& _environment;
  Inbox _inbox;
  TransferLoop _loop;

  // Only the thread touches these.
  CurlHandlePool _pool;
  Jobs _waiting;
  Jobs _active;
  Jobs _settled;  ///< Have their results; their completions are still to be told.
  Moment _nextExpiry{};

  std::mutex _threadMutex;
  std::thread _thread;
};

}  // namespace tallyd::platform
