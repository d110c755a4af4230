// A program's connection to a service that speaks D-Bus without a bus.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/IPC.h"
#include "platform/ipc/BusConnection.h"

namespace tallyd::platform {

/// Calls the methods of one interface, any number at a time; each completion runs once, on the connection's
/// queue.
///
/// Calls leave in the order in which they were made, those made before authentication is over as soon as it
/// is. Threading: any thread; close() not on the connection's queue.
class SdBusClientConnection final : public BusConnection {
 public:
  struct Reply {
    std::optional<std::string> error;  ///< Why there are no results.
    std::vector<Value> results;
  };
  using Completion = std::function<void(Reply reply)>;

  struct Request {
    std::size_t methodIndex = 0;  ///< Into Interface::methods.
    std::vector<Value> arguments;
    std::vector<FileDescriptor> descriptors;  ///< In the order of the "h" in the method's signature.
  };

  /// Connects; borrows queues and interface. Throws std::system_error that names the path.
  static std::shared_ptr<SdBusClientConnection> connect(const std::filesystem::path& socketPath,
                                                        const Interface& interface, Queues& queues);

  SdBusClientConnection(FileDescriptor socket, const Interface& interface,
                        std::shared_ptr<SerialQueue> queue);
  ~SdBusClientConnection();

  /// Called when the connection breaks within a message; not after close().
  void setInterruptionHandler(std::function<void()> handler);
  /// Called once, when the connection has ended by itself; at once when it has already.
  void setInvalidationHandler(std::function<void()> handler);

  /// An empty completion asks for no answer.
  void call(Request request, std::chrono::milliseconds timeout, Completion completion);

  /// Sends what has been called, lets the service hear and answer it, and closes, all within `patience`;
  /// calls that have no answer then fail.
  void close(std::chrono::milliseconds patience);

 private:
  struct Pending;
  struct Waiting {
    Request request;
    std::chrono::milliseconds timeout;
    Completion completion;
  };

  void setUp(sd_bus* bus) override;
  bool incoming(sd_bus_message*) override { return false; }
  bool settled() override;
  void ended(End end) override;

  void submit(Waiting call);
  void send(Waiting call);
  bool sendWaiting();
  static int handleReply(sd_bus_message* message, void* pending, void* error) noexcept;
  void finish(std::uint64_t number, Reply reply);

  const Interface& _interface;
  std::deque<Waiting> _waiting;  ///< Until authentication is over, and while the library's queue is full.
  std::unordered_map<std::uint64_t, std::unique_ptr<Pending>> _pending;
  std::uint64_t _lastNumber = 0;
  bool _brokeOff = false;  ///< Ended while nobody was closing it.
  bool _over = false;
  bool _closing = false;
  bool _halfClosed = false;
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;

  std::mutex _closedMutex;
  std::condition_variable _closedChanged;
  bool _closed = false;
};

}  // namespace tallyd::platform
