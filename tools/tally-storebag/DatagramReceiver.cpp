#include "tally-storebag/DatagramReceiver.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "backends/dashboard/Datagram.h"

namespace tallyd::storebagtool {

namespace {

void require(bool succeeded) {
  if (!succeeded) throw std::system_error(errno, std::generic_category(), "a socket for datagrams");
}

}  // namespace

DatagramReceiver::DatagramReceiver() : _socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  require(static_cast<bool>(_socket));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  auto* generic = reinterpret_cast<sockaddr*>(&address);
  require(::bind(_socket.get(), generic, size) == 0);
  require(::getsockname(_socket.get(), generic, &size) == 0);
  _port = ntohs(address.sin_port);
}

std::optional<std::string> DatagramReceiver::receive() const {
  pollfd waiting{_socket.get(), POLLIN, 0};
  if (::poll(&waiting, 1, static_cast<int>(kPatience.count())) != 1) return std::nullopt;
  std::array<char, kDatagramBufferBytes> buffer{};
  const ssize_t length = ::recv(_socket.get(), buffer.data(), buffer.size(), 0);
  if (length < 0) return std::nullopt;
  return std::string(buffer.data(), static_cast<std::size_t>(length));
}

}  // namespace tallyd::storebagtool
