#include "Collector.h"

#include <arpa/inet.h>
#include <fmt/format.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <charconv>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <utility>

namespace tallyd::bench {

using platform::FileDescriptor;

namespace {

constexpr std::string_view kPostAnswer = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n";
constexpr std::string_view kEndOfHead = "\r\n\r\n";
constexpr std::chrono::seconds kPatience{30};  ///< Without one more post.

[[noreturn]] void fail(const char* what) { throw std::system_error(errno, std::generic_category(), what); }

FileDescriptor listeningSocket() {
  FileDescriptor socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (!socket || ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(socket.get(), SOMAXCONN) != 0) {
    fail("the collector can't listen");
  }
  return socket;
}

std::uint16_t portOf(int socket) {
  sockaddr_in address{};
  socklen_t size = sizeof address;
  if (::getsockname(socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) fail("getsockname");
  return ntohs(address.sin_port);
}

/// The daemon writes the name of this field in one way only.
std::size_t contentLengthOf(std::string_view head) {
  constexpr std::string_view kField = "\r\nContent-Length: ";
  const auto at = head.find(kField);
  std::size_t length = 0;
  if (at != std::string_view::npos)
    std::from_chars(head.data() + at + kField.size(), head.data() + head.size(), length);
  return length;
}

/// Answers are small and find room; false when the connection is broken.
bool sendAll(int socket, std::string_view bytes) {
  return ::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

}  // namespace

struct Collector::Connection {
  FileDescriptor socket;
  std::string received{};
};

Collector::Collector(const std::string& storebag, PostAnswers answers)
    : _answers(answers),
      _storebagAnswer(
          fmt::format("HTTP/1.1 200 OK\r\nCache-Control: max-age=86400\r\nContent-Length: {}\r\n\r\n{}",
                      storebag.size(), storebag)),
      _listener(listeningSocket()),
      _stop(eventfd(0, EFD_CLOEXEC)),
      _port(portOf(_listener.get())),
      _thread([this] { serve(); }) {}

Collector::~Collector() {
  eventfd_write(_stop.get(), 1);
  _thread.join();
}

std::string Collector::url(const std::string& path) const {
  return fmt::format("http://127.0.0.1:{}{}", _port, path);
}

void Collector::waitForPosts(std::size_t count) {
  std::unique_lock lock(_mutex);
  _awaited = count;
  std::size_t before = _posts.size();
  while (!_enough.wait_for(lock, kPatience, [&] { return _posts.size() >= count; })) {
    if (_posts.size() == before) {
      throw std::runtime_error(fmt::format("only {} of {} posts came", _posts.size(), count));
    }
    before = _posts.size();
  }
  _awaited = SIZE_MAX;
}

std::vector<std::string> Collector::takePosts() {
  const std::lock_guard lock(_mutex);
  return std::exchange(_posts, {});
}

std::vector<std::string> Collector::headersOfLastPost() {
  constexpr std::string_view kEndOfLine = "\r\n";
  const std::lock_guard lock(_mutex);
  std::vector<std::string> headers;
  // The first line is the request's.
  for (auto end = _lastHead.find(kEndOfLine); end != std::string::npos;) {
    const std::size_t start = end + kEndOfLine.size();
    end = _lastHead.find(kEndOfLine, start);
    headers.push_back(_lastHead.substr(start, end - start));
  }
  return headers;
}

void Collector::serve() {
  std::vector<Connection> connections;
  while (true) {
    std::vector<pollfd> polled{{_stop.get(), POLLIN, 0}, {_listener.get(), POLLIN, 0}};
    for (const Connection& connection : connections) polled.push_back({connection.socket.get(), POLLIN, 0});
    ::poll(polled.data(), polled.size(), -1);
    if (polled[0].revents != 0) return;
    // From the last to the first, so that an ended one can be taken out.
    for (std::size_t i = connections.size(); i-- > 0;) {
      if (polled[i + 2].revents == 0 || serveConnection(connections[i])) continue;
      connections.erase(connections.begin() + static_cast<std::ptrdiff_t>(i));
    }
    if (polled[1].revents != 0) {
      FileDescriptor socket(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
      const int on = 1;
      ::setsockopt(socket.get(), IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
      if (socket) connections.push_back({std::move(socket)});
    }
  }
}

bool Collector::serveConnection(Connection& connection) {
  char bytes[65'536];
  const ssize_t length = ::recv(connection.socket.get(), bytes, sizeof bytes, 0);
  if (length <= 0) return false;
  connection.received.append(bytes, static_cast<std::size_t>(length));
  return answerRequests(connection);
}

bool Collector::answerRequests(Connection& connection) {
  std::string& received = connection.received;
  while (true) {
    const auto endOfHead = received.find(kEndOfHead);
    if (endOfHead == std::string::npos) return true;
    const std::string_view head = std::string_view(received).substr(0, endOfHead);
    const std::size_t start = endOfHead + kEndOfHead.size();
    const std::size_t length = contentLengthOf(head);
    if (received.size() < start + length) return true;
    const bool isPost = received.starts_with("POST ");
    const bool answered = (isPost && _answers == PostAnswers::Never) ||
                          sendAll(connection.socket.get(), isPost ? kPostAnswer : _storebagAnswer);
    if (isPost) keepPost(head, received.substr(start, length));
    received.erase(0, start + length);
    if (!answered) return false;
  }
}

void Collector::keepPost(std::string_view head, std::string body) {
  const std::lock_guard lock(_mutex);
  _lastHead = head;
  _posts.push_back(std::move(body));
  if (_posts.size() >= _awaited) _enough.notify_all();
}

}  // namespace tallyd::bench
