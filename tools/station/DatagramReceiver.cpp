#include "station/DatagramReceiver.h"

#include <arpa/inet.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <thread>
#include <utility>

#include "platform/FileDescriptor.h"

namespace tallyd::station {

namespace {

using platform::FileDescriptor;
using std::chrono::steady_clock;

/// Room for the largest datagram of the daemon and for seeing that another one is larger.
constexpr std::size_t kBufferBytes = 2048;
/// A burst of some thousands must wait here while the disk is busy; the system may allow less.
constexpr int kSocketBufferBytes = 4 << 20;

FileDescriptor boundSocket(int port) {
  FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, IPPROTO_UDP));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(static_cast<std::uint16_t>(port));
  if (!socket || ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error(
        fmt::format("can't receive datagrams on 127.0.0.1:{}: {}", port, std::strerror(errno)));
  }
  ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVBUF, &kSocketBufferBytes, sizeof kSocketBufferBytes);
  return socket;
}

int portOf(const FileDescriptor& socket) {
  sockaddr_in address{};
  socklen_t length = sizeof address;
  ::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&address), &length);
  return ntohs(address.sin_port);
}

std::optional<Packet> receive(const FileDescriptor& socket) {
  std::array<char, kBufferBytes> buffer;
  Packet packet;
  socklen_t length = sizeof packet.peer;
  const ssize_t count = ::recvfrom(socket.get(), buffer.data(), buffer.size(), 0,
                                   reinterpret_cast<sockaddr*>(&packet.peer), &length);
  if (count < 0) return std::nullopt;
  packet.bytes.assign(buffer.data(), static_cast<std::size_t>(count));
  return packet;
}

/// How long poll(2) may wait, rounded up so that it does not wake too early.
int pollTimeout(std::optional<steady_clock::time_point> due) {
  constexpr std::chrono::milliseconds kLongest = std::chrono::hours(1);
  if (!due) return -1;
  const auto wait = std::chrono::ceil<std::chrono::milliseconds>(*due - steady_clock::now());
  return static_cast<int>(std::clamp(wait, std::chrono::milliseconds(0), kLongest).count());
}

}  // namespace

class DatagramReceiver::Implementation {
 public:
  Implementation(int port, const BadNetwork& network, const platform::Clock& clock, Journal& journal,
                 TerminalView& view)
      : _socket(boundSocket(port)),
        _port(portOf(_socket)),
        _stop(::eventfd(0, EFD_CLOEXEC)),
        _exchange(network, clock, journal, view),
        _thread([this] { run(); }) {}

  ~Implementation() {
    ::eventfd_write(_stop.get(), 1);
    _thread.join();
  }
  Implementation(const Implementation&) = delete;
  Implementation& operator=(const Implementation&) = delete;

  [[nodiscard]] int port() const { return _port; }
  [[nodiscard]] DatagramTotals totals() const {
    const std::lock_guard lock(_mutex);
    return _exchange.totals();
  }

 private:
  void run() {
    std::array<pollfd, 2> ready{{{_socket.get(), POLLIN, 0}, {_stop.get(), POLLIN, 0}}};
    std::optional<steady_clock::time_point> due;
    while (true) {
      ::poll(ready.data(), ready.size(), pollTimeout(due));
      if (ready[1].revents != 0) return;
      const std::lock_guard lock(_mutex);
      if (ready[0].revents != 0) {
        if (auto packet = receive(_socket)) _exchange.arrive(*std::move(packet), steady_clock::now());
      }
      // An acknowledgement that can't be sent is like one that is lost on its way.
      for (const Packet& packet : _exchange.advance(steady_clock::now())) {
        ::sendto(_socket.get(), packet.bytes.data(), packet.bytes.size(), 0,
                 reinterpret_cast<const sockaddr*>(&packet.peer), sizeof packet.peer);
      }
      due = _exchange.nextDue();
    }
  }

  const FileDescriptor _socket;
  const int _port;
  const FileDescriptor _stop;
  mutable std::mutex _mutex;
  DatagramExchange _exchange;
  std::thread _thread;  ///< Last: it uses the others.
};

DatagramReceiver::DatagramReceiver(int port, const BadNetwork& network, const platform::Clock& clock,
                                   Journal& journal, TerminalView& view)
    : _implementation(std::make_unique<Implementation>(port, network, clock, journal, view)) {}

DatagramReceiver::~DatagramReceiver() = default;

int DatagramReceiver::port() const { return _implementation->port(); }

DatagramTotals DatagramReceiver::totals() const { return _implementation->totals(); }

}  // namespace tallyd::station
