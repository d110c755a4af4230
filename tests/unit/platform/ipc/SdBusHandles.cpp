#include "SdBusHandles.h"

#include <systemd/sd-bus.h>

#include <system_error>

namespace tallyd::platform {

void BusCloser::operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }

BusMessage adoptMessage(sd_bus_message* message) { return {message, sd_bus_message_unref}; }

BusMessage retainMessage(sd_bus_message* message) { return adoptMessage(sd_bus_message_ref(message)); }

int checkBus(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::system_category(), what);
  return result;
}

}  // namespace tallyd::platform
