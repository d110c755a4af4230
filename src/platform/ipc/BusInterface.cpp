#include "platform/ipc/BusInterface.h"

#include <systemd/sd-bus.h>

#include <algorithm>

namespace tallyd::platform {

struct BusInterface::Table {
  std::vector<std::string> names;  ///< Of each method's arguments and results, each ended by a NUL.
  std::vector<sd_bus_vtable> entries;
};

namespace {

std::string joinedNames(const InterfaceMethod& method) {
  std::string joined;
  for (const auto* names : {&method.inNames, &method.outNames}) {
    for (const auto& name : *names) joined.append(name).push_back('\0');
  }
  return joined;
}

int handOver(sd_bus_message* call, void* receiver, sd_bus_error* /*error*/) noexcept {
  static_cast<BusCallReceiver*>(receiver)->receiveCall(call);
  return 1;  // Needs nothing more; the answer may come later.
}

sd_bus_vtable methodEntry(const InterfaceMethod& method, const std::string& names) {
  sd_bus_vtable entry{};
  entry.type = _SD_BUS_VTABLE_METHOD;
  entry.x.method.member = method.name.c_str();
  entry.x.method.signature = method.in.c_str();
  entry.x.method.result = method.out.c_str();
  entry.x.method.handler = handOver;
  entry.x.method.names = names.c_str();
  return entry;
}

}  // namespace

BusInterface::BusInterface(const Interface& exported) : _exported(exported) {
  auto table = std::make_unique<Table>();
  table->names.reserve(exported.methods.size());
  table->entries.push_back(SD_BUS_VTABLE_START(0));
  for (const auto& method : exported.methods) {
    table->names.push_back(joinedNames(method));
    table->entries.push_back(methodEntry(method, table->names.back()));
  }
  table->entries.push_back(SD_BUS_VTABLE_END);
  _table = std::move(table);
}

BusInterface::~BusInterface() = default;

void BusInterface::addTo(sd_bus* bus, BusCallReceiver& receiver) const {
  const std::lock_guard lock(
      _addingMutex);  // The library draws a key for its hash tables, the first time unlocked.
  checkBus(sd_bus_add_object_vtable(bus, nullptr, _exported.objectPath.c_str(), _exported.name.c_str(),
                                    _table->entries.data(), &receiver),
           "sd_bus_add_object_vtable");
}

std::size_t BusInterface::methodIndex(std::string_view name) const {
  const auto found = std::find_if(_exported.methods.begin(), _exported.methods.end(),
                                  [name](const auto& method) { return method.name == name; });
  return static_cast<std::size_t>(found - _exported.methods.begin());
}

const BusInterface& BusInterfaces::of(const Interface& exported) {
  const std::lock_guard lock(_mutex);
  return _made.try_emplace(&exported, exported).first->second;
}

}  // namespace tallyd::platform
