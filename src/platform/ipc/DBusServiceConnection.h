// A client's connection as the daemon sees it: D-Bus without a bus.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/IPC.h"
#include "platform/ipc/DBusConnection.h"

namespace tallyd::platform {

/// Takes EXTERNAL and ANONYMOUS authentication and descriptors, answers what D-Bus asks of every peer
/// (StandardInterfaces), and hands every call of the exported interface that can be read to the exported
/// object.
///
/// Until it is resumed it belongs to one thread; from then on everything happens on its serial queue. A peer
/// that sends nothing costs memory only, until the time for authentication is over.
class DBusServiceConnection final : public ServiceConnection, public DBusConnection {
 public:
  /// @param number  of the connection, for the unique name that Hello answers.
  DBusServiceConnection(FileDescriptor socket, Queues& queues, std::uint64_t number);
  ~DBusServiceConnection() override;

  [[nodiscard]] std::string description() const override;
  [[nodiscard]] std::optional<uid_t> peerUser() const override;
  void setExportedInterface(const Interface& exported) override { _interface = &exported; }
  void setExportedObject(std::shared_ptr<ExportedObject> object) override { _object = std::move(object); }
  void setInterruptionHandler(std::function<void()> handler) override {
    _interruptionHandler = std::move(handler);
  }
  void setInvalidationHandler(std::function<void()> handler) override {
    _invalidationHandler = std::move(handler);
  }
  void resume() override;
  void finish() override;

 private:
  class Call;

  void startService();
  void incoming(const dbus::Message& message, std::vector<FileDescriptor> descriptors) override;
  void ended(End end) override;

  void receiveCall(const dbus::Message& message, std::size_t methodIndex,
                   std::vector<FileDescriptor> descriptors);
  void answer(std::uint32_t call, std::string_view signature, const std::vector<Value>& results);
  void answerWithError(std::uint32_t call, std::string_view name, std::string_view reason);

  const std::uint64_t _number;
  const Interface* _interface = nullptr;
  std::shared_ptr<ExportedObject> _object;
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
};

}  // namespace tallyd::platform
