// A server that uses sd-bus and nothing else: the floor of a call's round trip and of a connection's memory.
// A program of its own, so that it loads no other library either.
//
// Takes connections as the daemon does, and answers FetchDisplayURL and SendMessageWithCategory as it does
// without a backend, arguments unread. Runs until it is ended.

#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <string>

#include "BusErrors.h"
#include "platform/FileDescriptor.h"

namespace {

using tallyd::bench::check;
using tallyd::bench::checkErrno;
using tallyd::platform::FileDescriptor;

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

FileDescriptor listeningSocket(const std::string& path) {
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
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

[[noreturn]] void serve(const std::string& socketPath) {
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

}  // namespace

int main(int argumentCount, char** arguments) {
  if (argumentCount != 2) {
    std::fputs("Usage: tallyd-bench-floor SOCKET\n", stderr);
    return EXIT_FAILURE;
  }
  try {
    serve(arguments[1]);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "tallyd-bench-floor: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
