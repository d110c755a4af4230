// One end of a D-Bus connection without a bus between, driven by a serial queue.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/SerialQueue.h"
#include "platform/ipc/BusHandles.h"
#include "platform/ipc/StreamPosition.h"

namespace tallyd::platform {

/// Turns the library's descriptor, events and timeouts into sources of the queue.
///
/// An idle connection holds one read source. A write source exists only while output is pending, a timer only
/// while the library waits for a time. The sources keep the object until the connection ends. Bounds: when
/// more than kMaximumQueuedMessages wait for a peer that does not read, nothing more is read from it.
/// Threading: everything on the queue, unless stated otherwise.
class BusConnection : public std::enable_shared_from_this<BusConnection> {
 public:
  static constexpr std::uint64_t kMaximumQueuedMessages = 256;
  /// Then the other connections' turn comes.
  static constexpr int kMessagesPerTurn = 64;

  BusConnection(const BusConnection&) = delete;
  BusConnection& operator=(const BusConnection&) = delete;

 protected:
  enum class End {
    BetweenMessages,  ///< Closed by either side.
    WithinMessage,    ///< Cut off, or something came that is no message.
  };

  /// Any thread.
  BusConnection(FileDescriptor socket, std::shared_ptr<SerialQueue> queue);
  ~BusConnection();

  /// Sets up the library's object; the socket is its own from then on. Then starts it.
  void start();
  /// After sending outside of incoming(), and after anything else that may change what is to be waited for.
  void wake();
  /// Closes at once; what is queued is dropped. ended() is called unless it was before.
  void end(End end);
  /// For the destructor of a class whose members the library's object uses.
  void dropBus() { _bus.reset(); }

  virtual void setUp(sd_bus* bus) = 0;                 ///< Before the start. Throws std::system_error.
  virtual bool incoming(sd_bus_message* message) = 0;  ///< True when it needs no further treatment.
  virtual bool settled() { return false; }             ///< Nothing to do at present; true when there is now.
  virtual void ended(End end) = 0;                     ///< Once, last.

  [[nodiscard]] sd_bus* bus() const { return _bus.get(); }  ///< Null before the start and after the end.
  [[nodiscard]] const std::shared_ptr<SerialQueue>& queue() const { return _queue; }
  [[nodiscard]] int descriptor() const { return _descriptor; }
  [[nodiscard]] std::uint64_t queuedMessages() const;
  /// The other side has closed its end wholly; what it sent before may still wait here.
  [[nodiscard]] bool peerHasGone() const;

 private:
  enum class Step { More, Idle, Ended };
  struct Waiting;

  static int filter(sd_bus_message* message, void* self, void* error) noexcept;
  void takeTurn();
  Step step();
  Step processed(int result, const Waiting& before);
  void lookAtSocket(Waiting& waiting) const;
  [[nodiscard]] bool hasWork(const Waiting& waiting) const;
  void followAuthentication(const Waiting& before);
  void chooseSources();
  void chooseTimer();
  [[nodiscard]] Work turn();

  FileDescriptor _socket;  ///< Until the start.
  int _descriptor;
  const std::shared_ptr<SerialQueue> _queue;
  BusHandle _bus;
  std::unique_ptr<Source> _readSource;
  std::unique_ptr<Source> _writeSource;
  std::unique_ptr<Source> _timer;
  std::uint64_t _timerTime = 0;
  bool _ended = false;
  bool _takingTurn = false;
  bool _turnQueued = false;

  StreamPosition _position;
  std::optional<std::uint64_t> _deliveredSerial;  ///< In the present step.
  std::unique_ptr<std::string> _authentication;  ///< The other side's part of the dialogue, until it is over.
  bool _mayHaveReadAhead = false;                ///< The library may have a message that no event tells of.
};

}  // namespace tallyd::platform
