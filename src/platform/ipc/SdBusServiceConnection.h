// A client's connection as the daemon sees it: D-Bus without a bus, by sd-bus.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/IPC.h"
#include "platform/ipc/BusConnection.h"
#include "platform/ipc/BusInterface.h"

namespace tallyd::platform {

/// Takes EXTERNAL and ANONYMOUS authentication and descriptors, answers org.freedesktop.DBus.Hello and
/// introspection, and hands every call of the exported interface that can be read to the exported object.
///
/// Until it is resumed it belongs to one thread; from then on everything happens on its serial queue. A peer
/// that sends nothing costs memory only, until the library's time limit for authentication is over.
class SdBusServiceConnection final : public ServiceConnection, public BusConnection, private BusCallReceiver {
 public:
  /// What the connections of one listener share.
  struct Shared {
    Queues& queues;
    BusInterfaces interfaces;
    explicit Shared(Queues& borrowedQueues) : queues(borrowedQueues) {}
  };

  /// @param number  of the connection, for the unique name that Hello answers.
  SdBusServiceConnection(FileDescriptor socket, std::shared_ptr<Shared> shared, std::uint64_t number);
  ~SdBusServiceConnection() override;

  [[nodiscard]] std::string description() const override;
  [[nodiscard]] std::optional<uid_t> peerUser() const override;
  void setExportedInterface(const Interface& exported) override;
  void setExportedObject(std::shared_ptr<ExportedObject> object) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void resume() override;

 private:
  class Call;

  void setUp(sd_bus* bus) override;
  bool incoming(sd_bus_message* message) override;
  void ended(End end) override;

  void receiveCall(sd_bus_message* message) override;

  void answer(sd_bus_message* call, std::size_t methodIndex, const std::vector<Value>& results);
  void reject(sd_bus_message* call, const std::string& reason);
  void sendError(sd_bus_message* call, const char* name, const std::string& reason);
  void send(const BusMessage& message);
  void releaseOnQueue(BusMessage message) const;

  const std::shared_ptr<Shared> _shared;
  const std::uint64_t _number;
  const BusInterface* _interface = nullptr;
  std::shared_ptr<ExportedObject> _object;
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
};

}  // namespace tallyd::platform
