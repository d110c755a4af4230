// Inter-process communication: a named service, its connections, and the calls that arrive on them.
#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd::platform {

/// One method of an exported interface; the types are D-Bus signatures (D-Bus Specification, "Type System").
///
/// Arguments and results travel as values: "s" strings, integers as integers, "b" booleans, "d" reals, "ay"
/// data, any other array as an array, "a{sv}" dictionaries, "v" the value itself, "h" null (the descriptors
/// travel beside the values, in order).
struct InterfaceMethod {
  std::string name;
  std::string in;  ///< Signature of the arguments, such as "qqaa{sv}".
  std::vector<std::string> inNames;
  std::string out;  ///< Signature of the results.
  std::vector<std::string> outNames;
};

/// An interface that a service exports at one object path.
struct Interface {
  std::string objectPath;
  std::string name;
  std::vector<InterfaceMethod> methods;
};

/// A call under way. A call that nobody replies to stays without an answer.
///
/// Threading: the connection's queue.
class IncomingCall {
 public:
  virtual ~IncomingCall() = default;

  [[nodiscard]] virtual std::size_t methodIndex() const = 0;  ///< Into Interface::methods.
  [[nodiscard]] virtual const std::vector<Value>& arguments() const = 0;
  [[nodiscard]] virtual std::vector<FileDescriptor>& descriptors() = 0;
  /// False for a call that was flagged to want no answer; replying to it does nothing.
  [[nodiscard]] virtual bool expectsReply() const = 0;
  /// Sends the results; they must fit the method's signature. Only the first answer counts.
  virtual void reply(std::vector<Value> results) = 0;
  /// Answers that the arguments are not as they must be (org.freedesktop.DBus.Error.InvalidArgs).
  virtual void rejectArguments(std::string_view reason) = 0;
};

/// What a connection's calls are for.
class ExportedObject {
 public:
  virtual ~ExportedObject() = default;
  /// One call, on the connection's queue, one at a time. The call may be kept and answered later.
  virtual void handleCall(const std::shared_ptr<IncomingCall>& call) = 0;
};

/// One client's connection, seen from the service.
///
/// Set it up, then resume it; calls, interruption and invalidation arrive on the connection's own serial
/// queue. Who the client is may be asked before that, and on that queue. It lives until it is invalidated and
/// nobody holds it.
class ServiceConnection {
 public:
  virtual ~ServiceConnection() = default;

  [[nodiscard]] virtual std::string description() const = 0;  ///< Which client: its process and user number.
  /// The user of the process that connected, as the system vouches for it; nothing when it can't tell.
  [[nodiscard]] virtual std::optional<uid_t> peerUser() const { return std::nullopt; }
  /// Borrows the interface; it must outlive every connection.
  virtual void setExportedInterface(const Interface& exported) = 0;
  virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
  /// Called when the connection breaks within a message or by a protocol error; invalidation follows.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  /// Called once, last; the connection then drops its object and its handlers.
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  virtual void resume() = 0;
  /// Hears what the client has sent by now and then ends the connection, as if the client had left. A client
  /// that does not read its answers is not waited for. After resume(); any thread.
  virtual void finish() = 0;
};

class ListenerDelegate {
 public:
  virtual ~ListenerDelegate() = default;
  /// Sets up and resumes the new connection; false closes it. Called on the listener's queue.
  virtual bool shouldAcceptNewConnection(const std::shared_ptr<ServiceConnection>& connection) = 0;
};

/// A named service's listener; destroying it stops accepting.
class Listener {
 public:
  virtual ~Listener() = default;
  virtual void setDelegate(ListenerDelegate& delegate) = 0;  ///< Borrowed; before resume().
  virtual void resume() = 0;
};

}  // namespace tallyd::platform
