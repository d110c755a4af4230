// Passes one client on to a service until it is cut, as if the service's process had died.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>

#include "platform/FileDescriptor.h"

namespace tallyd::tallyctl {

class CuttableRelay {
 public:
  CuttableRelay(const std::filesystem::path& socket, std::filesystem::path service)
      : _service(std::move(service)), _listening(makeSocket()) {
    const auto address = addressOf(socket);
    int ends[2];
    if (::bind(_listening.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        ::listen(_listening.get(), 1) != 0 || ::pipe(ends) != 0) {
      throw std::runtime_error("no relay at " + socket.string());
    }
    _cutRead = platform::FileDescriptor(ends[0]);
    _cutWrite = platform::FileDescriptor(ends[1]);
    _thread = std::thread([this] { relay(); });
  }
  ~CuttableRelay() {
    cut();
    _thread.join();
  }
  CuttableRelay(const CuttableRelay&) = delete;
  CuttableRelay& operator=(const CuttableRelay&) = delete;

  /// Both connections are closed soon after. Any thread.
  void cut() {
    const std::lock_guard lock(_mutex);  // The destructor's call waits for the one that ended the client.
    const char byte = 0;
    if (::write(_cutWrite.get(), &byte, 1) != 1) std::abort();
  }

 private:
  static platform::FileDescriptor makeSocket() {
    return platform::FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  }

  static sockaddr_un addressOf(const std::filesystem::path& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.string().size() >= sizeof address.sun_path)
      throw std::runtime_error("too long: " + path.string());
    std::strcpy(address.sun_path, path.c_str());
    return address;
  }

  /// Whether `descriptor` became ready before the cut.
  [[nodiscard]] bool waitFor(int descriptor) const {
    std::array<pollfd, 2> waiting{{{descriptor, POLLIN, 0}, {_cutRead.get(), POLLIN, 0}}};
    return ::poll(waiting.data(), waiting.size(), -1) > 0 && waiting[1].revents == 0;
  }

  static bool pass(int from, int to) {
    std::array<char, 4096> buffer;
    const ssize_t count = ::read(from, buffer.data(), buffer.size());
    return count > 0 && ::send(to, buffer.data(), static_cast<std::size_t>(count), MSG_NOSIGNAL) == count;
  }

  void relay() {
    if (!waitFor(_listening.get())) return;
    const platform::FileDescriptor client(::accept(_listening.get(), nullptr, nullptr));
    const platform::FileDescriptor service = makeSocket();
    const auto address = addressOf(_service);
    if (::connect(service.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) return;
    std::array<pollfd, 3> waiting{
        {{client.get(), POLLIN, 0}, {service.get(), POLLIN, 0}, {_cutRead.get(), POLLIN, 0}}};
    while (::poll(waiting.data(), waiting.size(), -1) > 0 && waiting[2].revents == 0) {
      if (waiting[0].revents != 0 && !pass(client.get(), service.get())) return;
      if (waiting[1].revents != 0 && !pass(service.get(), client.get())) return;
    }
  }

  const std::filesystem::path _service;
  platform::FileDescriptor _listening;
  std::mutex _mutex;
  platform::FileDescriptor _cutRead;
  platform::FileDescriptor _cutWrite;
  std::thread _thread;
};

}  // namespace tallyd::tallyctl
