// A program's connection to a service that speaks D-Bus without a bus.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/IPC.h"
#include "platform/ipc/DBusConnection.h"

namespace tallyd::platform {

/// Calls the methods of one interface, any number at a time; each completion runs once, on the connection's
/// queue.
///
/// Calls leave in the order in which they were made, those made before authentication is over as soon as it
/// is. Threading: any thread; close() not on the connection's queue.
class DBusClientConnection final : public DBusConnection {
 public:
  enum class Outcome {
    Answered,
    Rejected,      ///< The service answered with an error, or with results of other types.
    NotSent,       ///< The arguments do not fit the method.
    TimedOut,      ///< No answer in time; the service may have heard the call, or hear it still.
    Disconnected,  ///< The connection ended first; the service may have heard the call.
  };
  struct Reply {
    std::optional<std::string> error;  ///< Why there are no results.
    std::vector<Value> results;
    Outcome outcome = Outcome::Answered;
  };
  using Completion = std::function<void(Reply reply)>;

  struct Request {
    std::size_t methodIndex = 0;  ///< Into Interface::methods.
    std::vector<Value> arguments;
    std::vector<FileDescriptor> descriptors;  ///< In the order of the "h" in the method's signature.
  };

  /// Connects; borrows queues and interface. Throws std::system_error that names the path.
  static std::shared_ptr<DBusClientConnection> connect(const std::filesystem::path& socketPath,
                                                       const Interface& interface, Queues& queues);

  /// A socket that is connected to the service's. Waits up to `patience` while the service is too busy to
  /// take it (zero: not at all). Throws std::system_error that names the path.
  static FileDescriptor connectedSocket(const std::filesystem::path& path,
                                        std::chrono::milliseconds patience);

  /// Borrows the interface; start() begins.
  DBusClientConnection(FileDescriptor socket, const Interface& interface, std::shared_ptr<SerialQueue> queue);
  ~DBusClientConnection();

  /// Called when the connection breaks within a message; not after close().
  void setInterruptionHandler(std::function<void()> handler);
  /// Called once, when the connection has ended by itself; at once when it has already.
  void setInvalidationHandler(std::function<void()> handler);

  /// An empty completion asks for no answer. The timeout counts from the time when the call leaves.
  void call(Request request, std::chrono::milliseconds timeout, Completion completion);

  /// Sends what has been called, lets the service hear and answer it, and closes, all within `patience`;
  /// calls that have no answer then fail.
  void close(std::chrono::milliseconds patience);

  // For an owner that works on the connection's queue and keeps waiting calls itself. All on the queue.

  void start();
  /// `ready` runs whenever a call would leave at once, first when authentication is over; it returns whether
  /// it made one. `ended` runs last, also after finish() and abort(). Before the start.
  void setOwner(std::function<bool()> ready, std::function<void(bool withinMessage)> ended);
  /// Whether a call would leave now, to a service that has not closed its side yet.
  [[nodiscard]] bool isReady() const;
  void callNow(Request request, std::chrono::milliseconds timeout, Completion completion);
  void finish();  ///< As close(), without waiting for it.
  void abort();   ///< Ends at once; what has no answer fails.

 private:
  using Moment = std::chrono::steady_clock::time_point;

  /// A call that waits for its answer.
  struct Pending {
    std::size_t methodIndex;
    std::chrono::milliseconds timeout;
    Moment deadline;
    Completion completion;
  };
  struct Waiting {
    Request request;
    std::chrono::milliseconds timeout;
    Completion completion;
  };

  void incoming(const dbus::Message& message, std::vector<FileDescriptor> descriptors) override;
  bool drained() override;
  void ended(End end) override;

  void submit(Waiting call);
  void send(Waiting call);
  bool sendWaiting();
  [[nodiscard]] static Reply replyOf(const dbus::Message& message, std::string_view signature);
  void complete(std::uint32_t serial, Reply reply);
  void watchDeadline(Moment deadline);
  void expire();

  const Interface& _interface;
  std::deque<Waiting> _waiting;  ///< Until authentication is over, and while too much waits to be sent.
  std::map<std::uint32_t, Pending> _pending;  ///< By serial number.
  std::unique_ptr<Source> _timer;             ///< While a call waits for its answer.
  Moment _timerMoment{};
  bool _brokeOff = false;  ///< Ended while nobody was closing it.
  bool _over = false;
  bool _closing = false;
  bool _halfClosed = false;
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
  std::function<bool()> _ownerReady;
  std::function<void(bool withinMessage)> _ownerEnded;

  std::mutex _closedMutex;
  std::condition_variable _closedChanged;
  bool _closed = false;
};

}  // namespace tallyd::platform
