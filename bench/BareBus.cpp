#include "BareBus.h"

#include <systemd/sd-bus.h>

#include <cerrno>

#include "BusErrors.h"
#include "Events.h"
#include "ServerProcess.h"
#include "framework/ClientSessionInterface.h"

namespace tallyd::bench {

using platform::Dictionary;
using platform::Value;

namespace {

void appendVariant(sd_bus_message* message, const Value& value) {
  int result = -EINVAL;
  if (const auto text = value.string()) {
    result = sd_bus_message_append(message, "v", "s", std::string(*text).c_str());
  } else if (value.isBoolean()) {
    result = sd_bus_message_append(message, "v", "b", static_cast<int>(value.booleanValue()));
  } else if (value.isReal()) {
    result = sd_bus_message_append(message, "v", "d", *value.realValue());
  } else if (value.isInteger()) {
    result = sd_bus_message_append(message, "v", "x", *value.integerValue());
  }
  check(result, "sd_bus_message_append");
}

void appendPayload(sd_bus_message* message, const Dictionary& payload) {
  check(sd_bus_message_append(message, "qq", kCategory, kType), "sd_bus_message_append");
  check(sd_bus_message_open_container(message, 'a', "a{sv}"), "open array");
  check(sd_bus_message_open_container(message, 'a', "{sv}"), "open dictionary");
  for (const auto& [key, value] : payload) {
    check(sd_bus_message_open_container(message, 'e', "sv"), "open entry");
    check(sd_bus_message_append_basic(message, 's', key.c_str()), "append key");
    appendVariant(message, value);
    check(sd_bus_message_close_container(message), "close entry");
  }
  check(sd_bus_message_close_container(message), "close dictionary");
  check(sd_bus_message_close_container(message), "close array");
}

template <class Append>
void call(sd_bus* bus, const char* method, Append append) {
  const auto& interface = clientSessionInterface();
  sd_bus_message* message = nullptr;
  check(sd_bus_message_new_method_call(bus, &message, nullptr, interface.objectPath.c_str(),
                                       interface.name.c_str(), method),
        "sd_bus_message_new_method_call");
  append(message);
  sd_bus_message* reply = nullptr;
  const int result = sd_bus_call(bus, message, 0, nullptr, &reply);
  sd_bus_message_unref(reply);
  sd_bus_message_unref(message);
  check(result, method);
}

}  // namespace

BareServer::BareServer()
    : _process(std::make_unique<ServerProcess>(
          std::vector<std::string>{programBeside("tallyd-bench-floor"), socket().string()}, _folder.path())) {
}

BareServer::~BareServer() = default;

int BareServer::id() const { return _process->id(); }

BareClient::BareClient(const std::filesystem::path& socketPath) {
  check(sd_bus_new(&_bus), "sd_bus_new");
  check(sd_bus_set_address(_bus, ("unix:path=" + socketPath.string()).c_str()), "sd_bus_set_address");
  check(sd_bus_start(_bus), "sd_bus_start");
}

BareClient::~BareClient() { sd_bus_close_unref(_bus); }

void BareClient::fetchDisplayURL() {
  call(_bus, "FetchDisplayURL", [](sd_bus_message*) {});
}

void BareClient::sendMessage(const Dictionary& payload) {
  call(_bus, "SendMessageWithCategory", [&](sd_bus_message* message) { appendPayload(message, payload); });
}

}  // namespace tallyd::bench
