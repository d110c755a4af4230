#include "station/StationServer.h"

#include <fmt/format.h>
#include <httplib.h>
#include <sys/socket.h>

#include <atomic>
#include <cstring>
#include <stdexcept>
#include <thread>

namespace tallyd::station {

namespace {

constexpr const char* kAddress = "127.0.0.1";
constexpr const char* kStorebagPath = R"(/(?:storebags|bags)/sorrel/([^/]+))";
constexpr const char* kEventsPath = R"(/events(?:/.*)?)";

constexpr std::size_t kThreads = 32;
/// Of one post, decoded; a post holds at most some hundreds of events.
constexpr std::size_t kMaximumPostBytes = std::size_t{64} << 20;
/// How long an idle connection is kept, and so how long stopping may take.
constexpr std::time_t kKeepAliveSeconds = 1;

/// One server of the library's with its thread.
class Listener {
 public:
  Listener(std::unique_ptr<httplib::Server> server, int port) : _server(std::move(server)) {
    _server->new_task_queue = [] { return new httplib::ThreadPool(kThreads); };
    _server->set_keep_alive_max_count(1'000'000);
    _server->set_keep_alive_timeout(kKeepAliveSeconds);
    _server->set_payload_max_length(kMaximumPostBytes);
    _server->set_tcp_nodelay(true);
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
  Implementation(const Settings& settings, const BagFolder& bags, EventCollector& collector,
                 TerminalView& view)
      : _cacheControl(fmt::format("max-age={}", settings.maxAge.count())),
        _bags(bags),
        _collector(collector),
        _view(view),
        _https(makeTLSServer(settings), settings.httpsPort) {
    serveStorebags(_https.server());
    collectEvents(_https.server());
    if (settings.httpPort) {
      _http.emplace(std::make_unique<httplib::Server>(), *settings.httpPort);
      collectEvents(_http->server());
      _http->start();
    }
    _https.start();
  }

  [[nodiscard]] int httpsPort() const { return _https.port(); }
  [[nodiscard]] std::optional<int> httpPort() const {
    return _http ? std::optional<int>(_http->port()) : std::nullopt;
  }
  [[nodiscard]] std::uint64_t servedStorebags() const { return _servedStorebags; }

 private:
  void serveStorebags(httplib::Server& server) {
    server.Get(kStorebagPath, [this](const httplib::Request& request, httplib::Response& response) {
      const std::string name = request.matches[1];
      const BagFolder::Answer answer = _bags.storebag(name);
      response.status = answer.status;
      if (answer.status != 200) {
        response.set_content(answer.body, "text/plain; charset=utf-8");
        _view.showProblem(answer.body.substr(0, answer.body.find('\n')));
        return;
      }
      response.set_header("Cache-Control", _cacheControl);
      response.set_content(answer.body, "application/xml");
      ++_servedStorebags;
      _view.showNotice(
          fmt::format("served the storebag {} to version {}", name, request.get_param_value("version")));
    });
  }

  void collectEvents(httplib::Server& server) {
    server.Post(kEventsPath, [this](const httplib::Request& request, httplib::Response& response,
                                    const httplib::ContentReader& readContent) {
      const std::string encoding =
          request.has_header("Content-Encoding") ? request.get_header_value("Content-Encoding") : "identity";
      std::string body;
      const bool decoded = readContent([&body](const char* bytes, std::size_t size) {
        if (size > kMaximumPostBytes - body.size()) return false;
        body.append(bytes, size);
        return true;
      });
      std::optional<std::string> problem;
      if (decoded) {
        problem = _collector.collect(body, encoding);
      } else {
        problem = fmt::format("the body can't be decoded ({})", encoding);
        _collector.refuse(*problem);
      }
      response.status = problem ? 400 : 200;
      if (problem) response.set_content(*problem + "\n", "text/plain; charset=utf-8");
    });
  }

  const std::string _cacheControl;
  const BagFolder& _bags;
  EventCollector& _collector;
  TerminalView& _view;
  std::atomic<std::uint64_t> _servedStorebags{0};
  // Last: their threads use the others.
  Listener _https;
  std::optional<Listener> _http;
};

StationServer::StationServer(const Settings& settings, const BagFolder& bags, EventCollector& collector,
                             TerminalView& view)
    : _implementation(std::make_unique<Implementation>(settings, bags, collector, view)) {}

StationServer::~StationServer() = default;

int StationServer::httpsPort() const { return _implementation->httpsPort(); }

std::optional<int> StationServer::httpPort() const { return _implementation->httpPort(); }

std::uint64_t StationServer::servedStorebags() const { return _implementation->servedStorebags(); }

}  // namespace tallyd::station
