#include "station/StationServer.h"

#include <fmt/format.h>
#include <httplib.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <exception>
#include <stdexcept>
#include <string>
#include <thread>

#include "station/HTTPStatus.h"
#include "station/Limits.h"

namespace tallyd::station {

namespace {

constexpr const char* kAddress = "127.0.0.1";

void answerException(const httplib::Request&, httplib::Response& response, std::exception_ptr thrown) {
  response.status = kServerError;
  try {
    std::rethrow_exception(std::move(thrown));
  } catch (const std::exception& exception) {
    response.set_content(std::string(exception.what()) + "\n", "text/plain; charset=utf-8");
  } catch (...) {
    response.set_content("unknown error\n", "text/plain; charset=utf-8");
  }
}

/// One server of the library's with its thread.
class Listener {
 public:
  Listener(std::unique_ptr<httplib::Server> server, int port) : _server(std::move(server)) {
    _server->new_task_queue = [] { return new httplib::ThreadPool(kServerThreads); };
    _server->set_keep_alive_max_count(1'000'000);
    _server->set_keep_alive_timeout(kKeepAlive.count());
    _server->set_payload_max_length(kMaximumUploadBytes);
    _server->set_tcp_nodelay(true);
    _server->set_exception_handler(answerException);
    _server->set_socket_options([this](socket_t socket) {
      // Only this: the library's own options would let two stations share a port.
      const int yes = 1;
      ::setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
      _socket = socket;
    });
    bind(port);
  }

  ~Listener() {
    if (!_thread.joinable()) return;
    _server->stop();
    _thread.join();
  }

  void start() {
    _thread = std::thread([this] { _server->listen_after_bind(); });
    // A server that is told to stop before it runs would run on.
    while (!_server->is_running()) std::this_thread::yield();
  }

  [[nodiscard]] httplib::Server& server() { return *_server; }
  [[nodiscard]] int port() const { return _port; }

 private:
  void bind(int port) {
    const bool bound = port == 0 ? (_port = _server->bind_to_any_port(kAddress)) > 0
                                 : _server->bind_to_port(kAddress, _port = port);
    if (!bound) {
      throw std::runtime_error(
          fmt::format("can't listen on {}:{}: {}", kAddress, port, std::strerror(errno)));
    }
    // The library's queue of five would make a burst of connections wait for retransmissions.
    ::listen(_socket, SOMAXCONN);
  }

  std::unique_ptr<httplib::Server> _server;
  socket_t _socket = -1;
  int _port = 0;
  std::thread _thread;
};

std::unique_ptr<httplib::Server> makeTLSServer(const StationServer::Settings& settings) {
  auto server = std::make_unique<httplib::SSLServer>(settings.certificateFile.c_str(),
                                                     settings.certificateKeyFile.c_str());
  if (!server->is_valid()) {
    throw std::runtime_error(fmt::format("{} and {} are not a certificate and its key",
                                         settings.certificateFile.string(),
                                         settings.certificateKeyFile.string()));
  }
  return server;
}

}  // namespace

class StationServer::Implementation {
 public:
  Implementation(const Settings& settings, const std::vector<RouteGroup>& groups)
      : _https(makeTLSServer(settings), settings.httpsPort) {
    for (const RouteGroup& group : groups) group.addTo(_https.server());
    if (settings.httpPort) {
      _http.emplace(std::make_unique<httplib::Server>(), *settings.httpPort);
      for (const RouteGroup& group : groups) {
        if (group.reach == RouteGroup::Reach::HTTPSAndHTTP) group.addTo(_http->server());
      }
      _http->start();
    }
    _https.start();
  }

  [[nodiscard]] int httpsPort() const { return _https.port(); }
  [[nodiscard]] std::optional<int> httpPort() const {
    return _http ? std::optional<int>(_http->port()) : std::nullopt;
  }

 private:
  Listener _https;
  std::optional<Listener> _http;
};

StationServer::StationServer(const Settings& settings, const std::vector<RouteGroup>& groups)
    : _implementation(std::make_unique<Implementation>(settings, groups)) {}

StationServer::~StationServer() = default;

int StationServer::httpsPort() const { return _implementation->httpsPort(); }

std::optional<int> StationServer::httpPort() const { return _implementation->httpPort(); }

}  // namespace tallyd::station
