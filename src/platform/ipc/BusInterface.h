// An interface's description in the form that the D-Bus library wants.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/IPC.h"
#include "platform/ipc/BusHandles.h"

namespace tallyd::platform {

/// What calls are handed to.
class BusCallReceiver {
 public:
  /// One call whose arguments are of the method's types. It must be answered by the receiver.
  virtual void receiveCall(sd_bus_message* call) = 0;

 protected:
  ~BusCallReceiver() = default;
};

/// The library's table of one interface, shared by all connections that export it. Threading: any thread.
class BusInterface {
 public:
  explicit BusInterface(const Interface& exported);  ///< Borrowed.
  ~BusInterface();
  BusInterface(const BusInterface&) = delete;
  BusInterface& operator=(const BusInterface&) = delete;

  [[nodiscard]] const Interface& description() const { return _exported; }
  /// Exports the interface; this object and the receiver must outlive the bus. Throws std::system_error.
  void addTo(sd_bus* bus, BusCallReceiver& receiver) const;
  [[nodiscard]] std::size_t methodIndex(std::string_view name) const;  ///< Of a name that the interface has.

 private:
  struct Table;
  const Interface& _exported;
  std::unique_ptr<const Table> _table;
  mutable std::mutex _addingMutex;
};

/// The tables made so far. Threading: any thread.
class BusInterfaces {
 public:
  const BusInterface& of(const Interface& exported);

 private:
  std::mutex _mutex;
  std::map<const Interface*, BusInterface> _made;
};

}  // namespace tallyd::platform
