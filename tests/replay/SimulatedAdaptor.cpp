#include "replay/SimulatedAdaptor.h"

#include <stdexcept>

#include "platform/property-list/PropertyList.h"
#include "replay/Scenario.h"

namespace tallyd::replay {

namespace {

Surroundings* world = nullptr;

void* create() {
  ++world->received.adaptors;
  return new int(0);
}

void destroy(void* self) {
  --world->received.adaptors;
  delete static_cast<int*>(self);
}

void takeMessage(void*, std::uint16_t method, std::uint16_t respCode, const void* plist, std::size_t length) {
  if (world->draws.chance(world->weather.adaptorThrows)) {
    ++world->received.adaptorThrows;
    throw std::runtime_error("not today");
  }
  ++world->received.adaptorMessages;
  platform::Value payload;
  if (plist) {
    auto parsed = platform::propertyListWithData({static_cast<const char*>(plist), length});
    if (!parsed.value) return world->violated("an adaptor got a payload that is none: " + parsed.error);
    payload = *parsed.value;
  }
  const auto* dictionary = payload.dictionary();
  const auto serial = dictionary ? dictionary->integer(kSerialKey) : std::nullopt;
  if (serial) world->arrived(Channel::Adaptor, *serial, 1);
  world->trace.write("adaptor", "method {}, respCode {}: {}", method, respCode, payload.description());
}

constexpr PithAdaptorClass kClass{PITH_ADAPTOR_STRUCTURE_VERSION, create, destroy, takeMessage};

}  // namespace

SimulatedAdaptor::SimulatedAdaptor(Surroundings& surroundings) { world = &surroundings; }
SimulatedAdaptor::~SimulatedAdaptor() { world = nullptr; }
const PithAdaptorClass* SimulatedAdaptor::adaptorClass() const { return &kClass; }

}  // namespace tallyd::replay
