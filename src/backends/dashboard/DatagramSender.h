// The socket, the timer and the queue behind a dashboard backend.
#pragma once

#include <netinet/in.h>

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "backends/dashboard/Datagram.h"
#include "backends/dashboard/MessageQueue.h"
#include "platform/DatagramSocket.h"
#include "platform/SerialQueue.h"

namespace tallyd::platform {
class Log;
class Queues;
}  // namespace tallyd::platform

namespace tallyd {

/// Sends datagrams to one server, and again what was not sent or, with reliable delivery, not acknowledged.
///
/// Life cycle: useReliableUDP() or not, then start() once; from then on the timer ticks and holds this
/// object, until cleanup() or drop() ends it. Whatever the queue and the sources run holds this object, so
/// that it lives until they are done. The socket is closed once: by the source that goes last, or with this
/// object when no source was ever made for that.
///
/// Threading: the set-up belongs to one thread, of which the queue knows nothing yet; the other public
/// operations may be called from any thread and only hand work to the queue, on which everything else runs.
class DatagramSender : public std::enable_shared_from_this<DatagramSender> {
 public:
  using Milliseconds = std::chrono::milliseconds;

  static constexpr Milliseconds kDefaultPeriod{8000};
  /// Past this the period is clamped: milliseconds that 32 bits hold.
  static constexpr Milliseconds kLongestPeriod{INT32_MAX};
  /// What datagrams get to be acknowledged, after a clean-up and one tick.
  static constexpr Milliseconds kLastResortDelay{9500};
  /// What datagrams get after a drop: as many ticks as one needs that is sent on the first of them.
  static constexpr int kTicksAfterDrop = 21;

  /// Borrows the log, which must outlive the queue's work.
  DatagramSender(platform::Log& log, platform::Queues& queues,
                 std::unique_ptr<platform::DatagramSocket> socket,
                 std::shared_ptr<Account> account = std::make_shared<Account>());
  /// Books what still waits as dropped.
  ~DatagramSender();

  /// Binds the socket and asks for acknowledgements. Each failure is logged: one to bind leaves the delivery
  /// as it was, one to listen leaves it reliable without acknowledgements.
  void useReliableUDP();
  /// Connects the socket and starts the timer. A failure is logged and gives up what was made so far.
  [[nodiscard]] bool start(const sockaddr_in& server, Milliseconds period);
  /// Never changes after the set-up.
  [[nodiscard]] bool reliableUDP() const { return _delivery == Delivery::Reliable; }

  /// Before the first datagram.
  void setAccount(std::shared_ptr<Account> account);
  /// Takes a datagram that is booked as being in flight. Throws std::bad_alloc, and has not taken it then.
  void send(std::shared_ptr<const Datagram> datagram);
  /// Ends at once when nothing waits, else when nothing waits any more, or after a tick and 9.5 s.
  void cleanup();
  /// For an owner that goes without a clean-up: ends when nothing waits any more, or after 21 ticks.
  void drop();

 private:
  enum CleanupState : int { CleanupNotAsked = 0, CleanupRequested = 1, CleanupLastResortScheduled = 2 };

  void tryToSendMsg(const Datagram& datagram);
  void keep(const Datagram& datagram, PacketState state);
  [[nodiscard]] bool sendAllBytes(std::string_view bytes) const;
  void showOnTap(std::string_view bytes) const;
  void myPeriodicTask();
  void advanceCleanup();
  void advanceDrop();
  void processSocketRead();
  void cleanupSources();

  platform::Log& _log;
  const std::shared_ptr<platform::SerialQueue> _networkProcQueue;
  std::unique_ptr<platform::DatagramSocket> _socket;
  Delivery _delivery = Delivery::FireAndForget;
  bool _isStarted = false;
  sockaddr_in _server{};
  std::shared_ptr<Account> _account;
  MessageQueue _messageQueue;
  std::unique_ptr<platform::Source> _readSource;
  std::unique_ptr<platform::Source> _timer;
  CleanupState _cleanupState = CleanupNotAsked;
  std::optional<int> _ticksAfterDrop;  ///< Left; nothing until the drop.
};

}  // namespace tallyd
