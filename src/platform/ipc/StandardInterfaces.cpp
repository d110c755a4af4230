#include "platform/ipc/StandardInterfaces.h"

#include <fmt/format.h>
#include <systemd/sd-id128.h>

#include <algorithm>
#include <array>

#include "platform/dbus/ByteReader.h"
#include "platform/dbus/Message.h"
#include "platform/dbus/Signature.h"

namespace tallyd::platform {

namespace {

using dbus::MessageFields;

constexpr std::string_view kPeer = "org.freedesktop.DBus.Peer";
constexpr std::string_view kIntrospectable = "org.freedesktop.DBus.Introspectable";
constexpr std::string_view kProperties = "org.freedesktop.DBus.Properties";
constexpr std::string_view kBus = "org.freedesktop.DBus";
constexpr std::string_view kUnknownProperty = "org.freedesktop.DBus.Error.UnknownProperty";

constexpr std::string_view kIntrospectionStart =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    "\"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n"
    "<node>\n"
    " <interface name=\"org.freedesktop.DBus.Peer\">\n"
    "  <method name=\"Ping\"/>\n"
    "  <method name=\"GetMachineId\">\n"
    "   <arg type=\"s\" name=\"machine_uuid\" direction=\"out\"/>\n"
    "  </method>\n"
    " </interface>\n"
    " <interface name=\"org.freedesktop.DBus.Introspectable\">\n"
    "  <method name=\"Introspect\">\n"
    "   <arg name=\"xml_data\" type=\"s\" direction=\"out\"/>\n"
    "  </method>\n"
    " </interface>\n"
    " <interface name=\"org.freedesktop.DBus.Properties\">\n"
    "  <method name=\"Get\">\n"
    "   <arg name=\"interface_name\" direction=\"in\" type=\"s\"/>\n"
    "   <arg name=\"property_name\" direction=\"in\" type=\"s\"/>\n"
    "   <arg name=\"value\" direction=\"out\" type=\"v\"/>\n"
    "  </method>\n"
    "  <method name=\"GetAll\">\n"
    "   <arg name=\"interface_name\" direction=\"in\" type=\"s\"/>\n"
    "   <arg name=\"props\" direction=\"out\" type=\"a{sv}\"/>\n"
    "  </method>\n"
    "  <method name=\"Set\">\n"
    "   <arg name=\"interface_name\" direction=\"in\" type=\"s\"/>\n"
    "   <arg name=\"property_name\" direction=\"in\" type=\"s\"/>\n"
    "   <arg name=\"value\" direction=\"in\" type=\"v\"/>\n"
    "  </method>\n"
    " </interface>\n";

/// A method that every object has.
struct StandardMethod {
  std::string_view interface;
  std::string_view member;
  std::string_view in;
};
constexpr std::array<StandardMethod, 7> kStandardMethods{{{kPeer, "Ping", ""},
                                                          {kPeer, "GetMachineId", ""},
                                                          {kIntrospectable, "Introspect", ""},
                                                          {kProperties, "Get", "ss"},
                                                          {kProperties, "GetAll", "s"},
                                                          {kProperties, "Set", "ssv"},
                                                          {kBus, "Hello", ""}}};

CallRoute results(std::string_view signature, std::vector<Value> values) {
  return {.methodIndex = {}, .signature = signature, .results = std::move(values)};
}

CallRoute error(std::string_view name, std::string reason) {
  return {.methodIndex = {}, .errorName = name, .reason = std::move(reason)};
}

void appendArguments(std::string& xml, std::string_view signature, const std::vector<std::string>& names,
                     std::string_view direction) {
  for (std::size_t i = 0; !signature.empty(); ++i) {
    const auto length = dbus::completeTypeLength(signature);
    xml += fmt::format("   <arg type=\"{}\"", signature.substr(0, length));
    if (i < names.size()) xml += fmt::format(" name=\"{}\"", names[i]);
    xml += fmt::format(" direction=\"{}\"/>\n", direction);
    signature.remove_prefix(length);
  }
}

std::string interfaceXML(const Interface& exported) {
  std::string xml = fmt::format(" <interface name=\"{}\">\n", exported.name);
  for (const InterfaceMethod& method : exported.methods) {
    xml += fmt::format("  <method name=\"{}\">\n", method.name);
    appendArguments(xml, method.in, method.inNames, "in");
    appendArguments(xml, method.out, method.outNames, "out");
    xml += "  </method>\n";
  }
  return xml + " </interface>\n";
}

/// The next part of `whole` below `path`; nothing when `path` is not above it.
std::string_view childOnTheWay(std::string_view path, std::string_view whole) {
  if (path != "/") {
    if (!whole.starts_with(path)) return {};
    whole.remove_prefix(path.size());
  }
  if (whole.size() < 2 || whole[0] != '/') return {};
  return whole.substr(1, whole.find('/', 1) - 1);
}

std::string introspection(std::string_view path, const Interface* exported) {
  std::string xml(kIntrospectionStart);
  if (exported && path == exported->objectPath) xml += interfaceXML(*exported);
  if (exported) {
    const auto child = childOnTheWay(path, exported->objectPath);
    if (!child.empty()) xml += fmt::format(" <node name=\"{}\"/>\n", child);
  }
  return xml + "</node>\n";
}

CallRoute machineID() {
  sd_id128_t identifier{};
  if (const int result = sd_id128_get_machine(&identifier); result < 0)
    return error("org.freedesktop.DBus.Error.Failed", "this machine has no ID");
  char text[SD_ID128_STRING_MAX];
  return results("s", {Value(sd_id128_to_string(identifier, text))});
}

/// The interface that a call about properties names, its first argument.
std::string_view interfaceAskedFor(const dbus::Message& message) {
  return dbus::ByteReader(message.body, message.order).text();
}

CallRoute property(const dbus::Message& message, const Interface* exported) {
  const bool isObject = exported && message.fields.path == exported->objectPath;
  const std::string_view asked = interfaceAskedFor(message);
  const bool isKnown = (isObject && (asked.empty() || asked == exported->name)) || asked == kPeer ||
                       asked == kIntrospectable || asked == kProperties;
  if (!isKnown)
    return error("org.freedesktop.DBus.Error.UnknownInterface",
                 fmt::format("Unknown interface '{}'.", asked));
  if (message.fields.member == "GetAll") return results("a{sv}", {Value(Dictionary())});
  return error(kUnknownProperty, "There are no properties.");
}

CallRoute standard(const StandardMethod& method, const dbus::Message& message, const Interface* exported,
                   std::uint64_t number) {
  if (method.member == "Ping") return results("", {});
  if (method.member == "GetMachineId") return machineID();
  if (method.member == "Hello") return results("s", {Value(fmt::format(":1.{}", number))});
  if (method.interface == kIntrospectable)
    return results("s", {Value(introspection(message.fields.path, exported))});
  return property(message, exported);
}

CallRoute wrongTypes(const MessageFields& call, std::string_view interface, std::string_view expected) {
  return error(kInvalidArguments, fmt::format("Invalid arguments '{}' to call {}.{}(), expecting '{}'.",
                                              call.signature, interface, call.member, expected));
}

CallRoute unknown(const MessageFields& call, const Interface* exported, bool knowsPath) {
  if (!knowsPath)
    return error("org.freedesktop.DBus.Error.UnknownObject", fmt::format("Unknown object '{}'.", call.path));
  const bool knowsInterface =
      call.interface.empty() || (exported && call.interface == exported->name) || call.interface == kBus ||
      std::any_of(kStandardMethods.begin(), kStandardMethods.end(),
                  [&](const StandardMethod& method) { return method.interface == call.interface; });
  if (!knowsInterface)
    return error("org.freedesktop.DBus.Error.UnknownInterface",
                 fmt::format("Unknown interface '{}'.", call.interface));
  return error("org.freedesktop.DBus.Error.UnknownMethod",
               fmt::format("Unknown method {} or interface {}.", call.member, call.interface));
}

}  // namespace

CallRoute routeCall(const dbus::Message& message, const Interface* exported, std::uint64_t number) {
  const MessageFields& call = message.fields;
  const auto asks = [&call](std::string_view interface) {
    return call.interface.empty() || call.interface == interface;
  };
  const bool isObject = exported && call.path == exported->objectPath;
  if (isObject && asks(exported->name)) {
    const auto& methods = exported->methods;
    const auto found = std::find_if(methods.begin(), methods.end(),
                                    [&](const auto& method) { return method.name == call.member; });
    if (found != methods.end()) {
      if (found->in != call.signature) return wrongTypes(call, exported->name, found->in);
      return {.methodIndex = static_cast<std::size_t>(found - methods.begin())};
    }
  }
  const bool knowsPath =
      isObject || (exported && !childOnTheWay(call.path, exported->objectPath).empty()) || call.path == "/";
  for (const StandardMethod& method : kStandardMethods) {
    if (method.member != call.member || !asks(method.interface)) continue;
    if (!knowsPath && method.interface != kPeer && method.interface != kBus) break;
    if (method.in != call.signature) return wrongTypes(call, method.interface, method.in);
    return standard(method, message, exported, number);
  }
  return unknown(call, exported, knowsPath);
}

}  // namespace tallyd::platform
