// The thread on which all asynchronous HTTP requests of the process run.
#pragma once

#include <chrono>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/HTTPClient.h"
#include "platform/Log.h"
#include "platform/http/CurlHandles.h"
#include "platform/http/CurlTransfer.h"

namespace tallyd::platform {

/// Takes requests and tells each one's completion, on its own queue and exactly once, what became of it.
///
/// The thread starts with the first request. A bounded number of requests is in libcurl's hands, the others
/// wait in order of arrival; what all of them hold together is bounded too. Destroying the engine fails what
/// is unfinished and waits for the thread.
///
/// Threading: any thread may submit.
class TransferEngine {
 public:
  /// Borrows both.
  TransferEngine(const CurlEnvironment& environment, Log& log);
  ~TransferEngine();
  TransferEngine(const TransferEngine&) = delete;
  TransferEngine& operator=(const TransferEngine&) = delete;

  void submit(HTTPRequest request, std::shared_ptr<SerialQueue> queue, HTTPClient::Completion completion);

 private:
  using Moment = std::chrono::steady_clock::time_point;

  /// Who is to be told about a request, and how much it holds.
  struct Client {
    std::shared_ptr<SerialQueue> queue;
    HTTPClient::Completion completion;
    std::size_t heldBytes;
    Moment startBy;  ///< When it must have found a connection.
  };
  struct WaitingRequest {
    HTTPRequest request;
    Client client;
  };
  struct ActiveTransfer {
    std::unique_ptr<CurlTransfer> transfer;
    Client client;
  };

  /// What submitters and the thread share.
  class Inbox {
   public:
    enum class Answer { TakenAsFirst, Taken, Full, Closed };
    explicit Inbox(std::size_t maximumBytes) : _maximumBytes(maximumBytes) {}

    [[nodiscard]] Answer add(WaitingRequest& request);  ///< Moves from `request` when it is taken.
    void takeAll(std::deque<WaitingRequest>& waiting);
    void release(std::size_t bytes);
    void close();
    [[nodiscard]] bool isClosed() const;

   private:
    const std::size_t _maximumBytes;
    mutable std::mutex _mutex;
    std::vector<WaitingRequest> _requests;
    std::size_t _heldBytes = 0;
    bool _closed = false;
  };

  void startThread();
  void threadMain() noexcept;
  void run();
  void startWaiting();
  void start(WaitingRequest request);
  void finishDone();
  [[nodiscard]] bool sendAgain(CURL* handle, CURLcode code);
  void expireLate();
  void finish(CURL* handle, const std::function<HTTPResult(CurlTransfer&)>& result);
  void failUnfinished(const std::string& reason);
  void tell(Client client, HTTPResult result);
  [[nodiscard]] int pollTimeoutMs() const;

  const CurlEnvironment& _environment;
  Log& _log;
  Inbox _inbox;
  CurlMulti _multi;
  std::once_flag _threadStarted;

  // Only the thread touches these.
  CurlHandlePool _pool;
  std::deque<WaitingRequest> _waiting;
  std::unordered_map<CURL*, ActiveTransfer> _active;
  Moment _nextExpiry{};

  std::thread _thread;
};

}  // namespace tallyd::platform
