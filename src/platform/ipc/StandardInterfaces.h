// What D-Bus asks of every peer, whatever it exports (D-Bus Specification, "Standard Interfaces").
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/IPC.h"

namespace tallyd::platform {

namespace dbus {
struct Message;
}

inline constexpr std::string_view kInvalidArguments = "org.freedesktop.DBus.Error.InvalidArgs";

/// What is to become of a call.
struct CallRoute {
  std::optional<std::size_t> methodIndex;  ///< A call of the exported interface: Interface::methods.
  // Otherwise what to answer: results, or an error.
  std::string_view signature{};
  std::vector<Value> results{};
  std::string_view errorName{};
  std::string reason{};
};

/// Finds the method of the exported interface, checks the types of its arguments, and answers everything
/// else: org.freedesktop.DBus.Peer on every path, Introspectable and Properties (there are none) on the
/// object and the nodes above it, and org.freedesktop.DBus.Hello, with which programs greet that think they
/// talk to a bus. Destinations mean nothing. Any thread.
///
/// @param exported  may be null.
/// @param number    the connection's, for the unique name that Hello answers.
[[nodiscard]] CallRoute routeCall(const dbus::Message& message, const Interface* exported,
                                  std::uint64_t number);

}  // namespace tallyd::platform
