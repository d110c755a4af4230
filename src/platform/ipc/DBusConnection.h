// One end of a D-Bus connection without a bus between, driven by a serial queue.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/SerialQueue.h"
#include "platform/Value.h"

namespace tallyd::platform {

namespace dbus {
class Authentication;
struct Message;
struct MessageFields;
}  // namespace dbus

/// Splits what arrives into messages and sends what is written, as many messages in one system call as come
/// together.
///
/// An idle connection holds one read source and no buffer. A write source exists only while the socket takes
/// no more. The sources keep the object until the connection ends. Bounds: when more than
/// kMaximumQueuedMessages or kMaximumQueuedBytes wait for a peer that does not read, nothing more is read
/// from it; at most kMaximumDescriptors wait for their messages; authentication may last kAuthenticationTime.
/// A connection that finds no memory for what it reads or waits for ends.
///
/// Threading: everything on the queue, unless stated otherwise.
class DBusConnection : public std::enable_shared_from_this<DBusConnection> {
 public:
  static constexpr std::size_t kMaximumQueuedMessages = 256;
  static constexpr std::size_t kMaximumQueuedBytes = std::size_t{4} * 1024 * 1024;
  static constexpr std::size_t kMaximumDescriptors = 256;
  static constexpr std::chrono::seconds kAuthenticationTime{90};
  static constexpr std::chrono::seconds kPatienceAtEnd{1};

  DBusConnection(const DBusConnection&) = delete;
  DBusConnection& operator=(const DBusConnection&) = delete;

 protected:
  enum class End {
    BetweenMessages,  ///< Closed by either side.
    WithinMessage,    ///< Cut off, or something came that is no message.
  };

  /// Any thread. The socket is a connected Unix stream.
  DBusConnection(FileDescriptor socket, std::shared_ptr<SerialQueue> queue);
  ~DBusConnection();

  /// Begins with this side's part of the authentication.
  void start(std::unique_ptr<dbus::Authentication> authentication);
  /// Closes at once; what is queued is dropped. ended() is called unless it was before.
  void end(End end);
  /// Takes what has arrived by now, then ends as if the peer had closed. When something hinders that because
  /// the peer does not read, it ends after kPatienceAtEnd.
  void endAfterInput();

  /// A serial number that no other message of this side has.
  [[nodiscard]] std::uint32_t nextSerial();
  /// Sends a message whose body is one value for each type of the signature, with the descriptors (the fields
  /// need not count them); at once, or with what else the present turn sends. Does nothing when nobody will
  /// read it.
  /// @return why it cannot be written; nothing is sent then, and neither when it throws std::bad_alloc.
  std::optional<std::string> write(dbus::MessageFields fields, const std::vector<Value>& values,
                                   std::vector<FileDescriptor> descriptors = {});

  virtual void authenticated() {}  ///< Messages can be written from now on.
  virtual void incoming(const dbus::Message& message, std::vector<FileDescriptor> descriptors) = 0;
  /// Nothing waits to be sent any more; true when something does now.
  virtual bool drained() { return false; }
  virtual void ended(End end) = 0;  ///< Once, last.

  /// Looks after what waits to be sent, and after drained(); for when that has something to do outside of a
  /// turn.
  void wake();

  [[nodiscard]] bool isStarted() const { return _isStarted; }
  [[nodiscard]] bool isOpen() const { return static_cast<bool>(_socket); }
  [[nodiscard]] bool isAuthenticated() const { return _isStarted && !_authentication && isOpen(); }
  [[nodiscard]] bool hasOutput() const { return _sentBytes < _output.size(); }
  /// The peer has closed its side; what it sent before may still wait to be read.
  [[nodiscard]] bool peerHasClosed() const;
  /// Too much waits for the peer.
  [[nodiscard]] bool isClogged() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& queue() const { return _queue; }
  [[nodiscard]] int descriptor() const { return _socket.get(); }

 private:
  /// Descriptors that leave with the byte at `at` of the output.
  struct Attachment {
    std::size_t at;
    std::vector<FileDescriptor> descriptors;
  };
  enum class Received { Bytes, Nothing, EndOfStream };

  template <class Part>
  void endWithoutMemory(const Part& part);
  [[nodiscard]] Work turn(void (DBusConnection::*part)());
  void readable();
  void writable();
  void finishTurn();
  void sendAndWatch();
  std::optional<std::string> append(const dbus::MessageFields& fields, const std::vector<Value>& values,
                                    std::vector<FileDescriptor> descriptors);
  Received receive(std::string_view& bytes);
  void take(std::string_view fresh);
  std::size_t takeWhole(std::string_view bytes);
  bool takeAuthentication(std::string_view bytes, std::size_t& taken);
  void takeMessage(std::string_view bytes);
  void inputEnded();
  void endUnlessReading();
  void flush();
  void forgetSent();
  void dropOutput();
  void chooseSources();

  FileDescriptor _socket;  ///< Invalid after the end.
  const std::shared_ptr<SerialQueue> _queue;
  std::unique_ptr<Source> _readSource;
  std::unique_ptr<Source> _writeSource;
  std::unique_ptr<Source> _authenticationTimer;
  std::unique_ptr<Source> _endTimer;                      ///< From endAfterInput() on.
  std::unique_ptr<dbus::Authentication> _authentication;  ///< Until it is over.
  bool _isStarted = false;
  bool _hasEnded = false;
  bool _isTakingTurn = false;
  bool _inputHasEnded = false;  ///< The peer sends no more, but may still read.
  bool _peerHasGone = false;    ///< Nobody reads any more.

  std::string _input;  ///< What came and was not taken yet: a part of a message, unless clogged.
  std::vector<FileDescriptor> _descriptors;  ///< Of messages that have not come wholly.

  std::string _output;
  std::size_t _sentBytes = 0;       ///< Of the output.
  std::size_t _queuedMessages = 0;  ///< Since nothing waited.
  std::vector<Attachment> _attachments;
  std::uint32_t _lastSerial = 0;
};

}  // namespace tallyd::platform
