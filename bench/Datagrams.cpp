#include "Datagrams.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <array>
#include <cerrno>
#include <stdexcept>
#include <string_view>
#include <system_error>

#include "Measure.h"

namespace tallyd::bench {

using platform::FileDescriptor;

namespace {

constexpr timeval kPatience{20, 0};
constexpr std::size_t kLargestDatagram = 2048;  ///< More than the daemon sends.
constexpr std::size_t kFloorDatagram = 300;

[[noreturn]] void fail(const char* what) { throw std::system_error(errno, std::generic_category(), what); }

sockaddr_in loopback(std::uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(port);
  return address;
}

}  // namespace

DatagramReceiver::DatagramReceiver() : _socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  constexpr int kBufferBytes = 1 << 20;  // The system may give less: kWindow is made for its usual limit.
  sockaddr_in address = loopback(0);
  socklen_t size = sizeof address;
  if (!_socket ||
      ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVBUF, &kBufferBytes, sizeof kBufferBytes) != 0 ||
      ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &kPatience, sizeof kPatience) != 0 ||
      ::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::getsockname(_socket.get(), reinterpret_cast<sockaddr*>(&address), &size) != 0) {
    fail("no socket for datagrams");
  }
  _port = ntohs(address.sin_port);
}

void DatagramReceiver::receive(std::size_t count, EventCheck& check) const {
  std::array<char, kLargestDatagram> bytes{};
  for (std::size_t i = 0; i < count; ++i) {
    const ssize_t length = ::recv(_socket.get(), bytes.data(), bytes.size(), 0);
    if (length < 0) throw std::runtime_error("a datagram was lost");
    check.addDatagram({bytes.data(), static_cast<std::size_t>(length)});
  }
}

double sendingProcessorSeconds(std::size_t count) {
  const DatagramReceiver receiver;
  const sockaddr_in address = loopback(receiver.port());
  const FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  const std::array<char, kFloorDatagram> bytes{};
  EventCheck check(0);
  double seconds = 0;
  for (std::size_t sent = 0; sent < count; sent += DatagramReceiver::kWindow) {
    const double start = processorSecondsOfThisThread();
    for (std::size_t i = 0; i < DatagramReceiver::kWindow; ++i) {
      if (::sendto(socket.get(), bytes.data(), bytes.size(), 0, reinterpret_cast<const sockaddr*>(&address),
                   sizeof address) < 0) {
        fail("sendto");
      }
    }
    seconds += processorSecondsOfThisThread() - start;
    receiver.receive(DatagramReceiver::kWindow, check);
  }
  return seconds;
}

}  // namespace tallyd::bench
