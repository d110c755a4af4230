// Owning handles of the D-Bus library's objects.
#pragma once

#include <memory>

struct sd_bus;
struct sd_bus_message;

namespace tallyd::platform {

struct BusCloser {
  void operator()(sd_bus* bus) const;  ///< Closes without sending what is queued.
};
using BusHandle = std::unique_ptr<sd_bus, BusCloser>;

/// A counted reference; the library's own count is not safe between threads, so messages stay on their bus's
/// queue.
using BusMessage = std::shared_ptr<sd_bus_message>;
[[nodiscard]] BusMessage adoptMessage(sd_bus_message* message);   ///< Takes over one reference.
[[nodiscard]] BusMessage retainMessage(sd_bus_message* message);  ///< Adds one.

/// Throws std::system_error when `result` is a negative errno, as the library's functions return it.
int checkBus(int result, const char* what);

}  // namespace tallyd::platform
