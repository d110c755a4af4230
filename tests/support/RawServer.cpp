#include "support/RawServer.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <strings.h>
#include <sys/socket.h>

#include <array>
#include <cstdlib>
#include <stdexcept>

namespace tallyd::test {

namespace {

std::size_t contentLength(std::string_view header) {
  constexpr std::string_view kName = "\r\ncontent-length:";
  for (std::size_t at = 0; at + kName.size() <= header.size(); ++at) {
    if (strncasecmp(header.data() + at, kName.data(), kName.size()) == 0) {
      return std::strtoul(header.data() + at + kName.size(), nullptr, 10);
    }
  }
  return 0;
}

}  // namespace

bool RequestReader::readMore() {
  const std::string bytes = nextBytes();
  _received += bytes;
  return !bytes.empty();
}

std::string RequestReader::readRequest() {
  while (true) {
    const auto size = requestSize(_received);
    if (size && _received.size() >= *size) {
      std::string request = _received.substr(0, *size);
      _received.erase(0, *size);
      return request;
    }
    if (!readMore()) return {};
  }
}

void RequestReader::waitForClose() {
  while (readMore()) {
  }
}

std::string RawConnection::nextBytes() {
  std::array<char, 4096> buffer;
  const ssize_t count = ::recv(_descriptor, buffer.data(), buffer.size(), 0);
  return {buffer.data(), count > 0 ? static_cast<std::size_t>(count) : 0};
}

void RawConnection::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(_descriptor, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count <= 0) return;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

void RawConnection::reset() const {
  // Dissolving the association is the way to an RST that needs no close(2) (connect(2)).
  const sockaddr unspecified{.sa_family = AF_UNSPEC, .sa_data = {}};
  ::connect(_descriptor, &unspecified, sizeof unspecified);
}

RawServer::RawServer(Script script)
    : _script(std::move(script)),
      _listener(listenOnLoopback()),
      _port(portOf(_listener.get())),
      _thread([this] { acceptClients(); }) {}

RawServer::~RawServer() {
  {
    const std::lock_guard lock(_mutex);
    _stopping = true;
    for (const Client& client : _clients) ::shutdown(client.descriptor.get(), SHUT_RDWR);
  }
  ::shutdown(_listener.get(), SHUT_RDWR);
  _thread.join();
  for (Client& client : _clients) client.thread.join();
}

std::string RawServer::url(const std::string& path) const {
  return "http://127.0.0.1:" + std::to_string(_port) + path;
}

void RawServer::acceptClients() {
  while (true) {
    platform::FileDescriptor accepted(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!accepted) return;
    const std::lock_guard lock(_mutex);
    if (_stopping) return;
    Client& client = _clients.emplace_back();
    client.descriptor = std::move(accepted);
    client.thread = std::thread([this, &client, number = ++_accepted] { runScript(client, number); });
  }
}

void RawServer::runScript(Client& client, int number) {
  RawConnection connection(client.descriptor.get(), number);
  _script(connection);
  ::shutdown(client.descriptor.get(), SHUT_RDWR);
}

std::optional<std::size_t> requestSize(std::string_view bytes) {
  const auto end = bytes.find("\r\n\r\n");
  if (end == std::string_view::npos) return std::nullopt;
  return end + 4 + contentLength(bytes.substr(0, end + 4));
}

platform::FileDescriptor listenOnLoopback() {
  platform::FileDescriptor listener(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const bool listens = listener &&
                       ::bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0 &&
                       ::listen(listener.get(), SOMAXCONN) == 0;
  if (!listens) throw std::runtime_error("can't listen on 127.0.0.1");
  return listener;
}

int portOf(int socket) {
  sockaddr_in address{};
  socklen_t size = sizeof address;
  if (::getsockname(socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) return 0;
  return ntohs(address.sin_port);
}

}  // namespace tallyd::test
