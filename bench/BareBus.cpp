#include "BareBus.h"

#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>

#include <array>
#include <cstring>
#include <system_error>

#include "Events.h"
#include "ServerProcess.h"
#include "framework/ClientSessionInterface.h"
#include "platform/FileDescriptor.h"

namespace tallyd::bench {

using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;

namespace {

int check(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), what);
  return result;
}

int checkErrno(int result, const char* what) { return check(result < 0 ? -errno : result, what); }

int answer(sd_bus_message* message, void* /*userData*/, sd_bus_error* /*error*/) {
  const char* member = sd_bus_message_get_member(message);
  if (!member || sd_bus_message_get_expect_reply(message) <= 0) return 0;
  if (std::strcmp(member, "FetchDisplayURL") == 0)
    return sd_bus_reply_method_return(message, "s", "URL not available");
  return sd_bus_reply_method_return(message, "as", 0);
}

sd_bus* acceptedBus(int listener) {
  const int socket =
      checkErrno(::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK), "accept");
  sd_bus* bus = nullptr;
  check(sd_bus_new(&bus), "sd_bus_new");
  check(sd_bus_set_fd(bus, socket, socket), "sd_bus_set_fd");
  check(sd_bus_set_server(bus, 1, {}), "sd_bus_set_server");
  check(sd_bus_set_anonymous(bus, 1), "sd_bus_set_anonymous");
  check(sd_bus_set_trusted(bus, 1), "sd_bus_set_trusted");
  check(sd_bus_negotiate_fds(bus, 1), "sd_bus_negotiate_fds");
  check(sd_bus_add_filter(bus, nullptr, answer, nullptr), "sd_bus_add_filter");
  check(sd_bus_start(bus), "sd_bus_start");
  return bus;
}

FileDescriptor listeningSocket(const std::filesystem::path& path) {
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  checkErrno(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), "bind");
  checkErrno(::listen(socket.get(), SOMAXCONN), "listen");
  return socket;
}

void watch(int epoll, int descriptor, sd_bus* bus) {
  epoll_event event{.events = EPOLLIN, .data = {.ptr = bus}};
  checkErrno(::epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event), "epoll_ctl");
}

/// Everything that has come for the connection; its answers are small, so they are written at once.
void process(sd_bus* bus) {
  int result = 1;
  while (result > 0) result = sd_bus_process(bus, nullptr);
  if (result < 0) sd_bus_close_unref(bus);
}

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

void runBareServer(const std::filesystem::path& socketPath) {
  const FileDescriptor listener = listeningSocket(socketPath);
  const FileDescriptor epoll(checkErrno(::epoll_create1(EPOLL_CLOEXEC), "epoll_create1"));
  watch(epoll.get(), listener.get(), nullptr);
  sd_notify(0, "READY=1");
  while (true) {
    std::array<epoll_event, 64> events{};
    const int count = ::epoll_wait(epoll.get(), events.data(), static_cast<int>(events.size()), -1);
    for (int i = 0; i < count; ++i) {
      auto* bus = static_cast<sd_bus*>(events[static_cast<std::size_t>(i)].data.ptr);
      if (!bus) {
        bus = acceptedBus(listener.get());
        watch(epoll.get(), sd_bus_get_fd(bus), bus);
      }
      process(bus);
    }
  }
}

BareServer::BareServer()
    : _process(std::make_unique<ServerProcess>(
          std::vector<std::string>{"/proc/self/exe", "--bare-server", socket().string()}, _folder.path())) {}

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
