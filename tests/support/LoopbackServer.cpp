#include "support/LoopbackServer.h"

#include <httplib.h>
#include <openssl/pem.h>
#include <strings.h>
#include <sys/socket.h>

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <set>
#include <stdexcept>
#include <thread>

namespace tallyd::test {

namespace {

constexpr std::size_t kThreads = 16;
constexpr std::chrono::seconds kPatience{20};

signing::OpenSSLPointer<X509> certificateFromPEM(const std::string& pem) {
  const signing::OpenSSLPointer<BIO> bio(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())));
  return signing::OpenSSLPointer<X509>(PEM_read_bio_X509(bio.get(), nullptr, nullptr, nullptr));
}

std::unique_ptr<httplib::Server> makeTLSServer(const signing::TLSIdentity& identity) {
  const auto certificate = certificateFromPEM(identity.certificatePEM);
  const auto key = signing::privateKeyFromPEM(identity.keyPEM);
  return std::make_unique<httplib::SSLServer>(certificate.get(), key.get());
}

}  // namespace

std::optional<std::string> ReceivedRequest::header(const std::string& name) const {
  for (const auto& [key, value] : headers) {
    if (strcasecmp(key.c_str(), name.c_str()) == 0) return value;
  }
  return std::nullopt;
}

class LoopbackServer::Implementation {
 public:
  Implementation(std::unique_ptr<httplib::Server> server, std::string scheme, Handler handler)
      : _server(std::move(server)), _scheme(std::move(scheme)), _handler(std::move(handler)) {
    _server->new_task_queue = [] { return new httplib::ThreadPool(kThreads); };
    _server->set_keep_alive_max_count(1'000'000);
    _server->set_tcp_nodelay(true);
    _server->set_socket_options([this](socket_t socket) { _listener = socket; });
    const auto answer = [this](const httplib::Request& request, httplib::Response& response) {
      handle(request, response);
    };
    _server->Get(".*", answer).Post(".*", answer).Put(".*", answer).Delete(".*", answer);
    _port = _server->bind_to_any_port("127.0.0.1");
    if (_port <= 0) throw std::runtime_error("no loopback server: can't bind");
    // The library's queue of five would make a burst of connections wait for retransmissions.
    ::listen(_listener, SOMAXCONN);
    _thread = std::thread([this] { _server->listen_after_bind(); });
    // A server that is told to stop before it runs would run on.
    while (!_server->is_running()) std::this_thread::yield();
  }

  ~Implementation() {
    _server->stop();
    _thread.join();
  }

  [[nodiscard]] int port() const { return _port; }
  [[nodiscard]] std::string url(const std::string& path) const {
    return _scheme + "://127.0.0.1:" + std::to_string(_port) + path;
  }
  [[nodiscard]] std::vector<ReceivedRequest> requests() const {
    const std::lock_guard lock(_mutex);
    return _requests;
  }
  [[nodiscard]] bool waitForRequests(std::size_t count) const {
    std::unique_lock lock(_mutex);
    return _received.wait_for(lock, kPatience, [&] { return _requests.size() >= count; });
  }

 private:
  void handle(const httplib::Request& request, httplib::Response& response) {
    ReceivedRequest received{request.method, request.target, {}, request.body, request.remote_port};
    for (const auto& [name, value] : request.headers) {
      // These the library adds itself, to what it received.
      if (name != "REMOTE_ADDR" && name != "REMOTE_PORT" && name != "LOCAL_ADDR" && name != "LOCAL_PORT") {
        received.headers.emplace_back(name, value);
      }
    }
    {
      const std::lock_guard lock(_mutex);
      _requests.push_back(received);
    }
    _received.notify_all();
    const ServedResponse served = _handler ? _handler(received) : ServedResponse{};
    response.status = served.status;
    response.body = served.body;
    for (const auto& [name, value] : served.headers) response.set_header(name, value);
  }

  std::unique_ptr<httplib::Server> _server;
  const std::string _scheme;
  const Handler _handler;
  socket_t _listener = -1;
  int _port = 0;
  mutable std::mutex _mutex;
  mutable std::condition_variable _received;
  std::vector<ReceivedRequest> _requests;
  std::thread _thread;
};

LoopbackServer::LoopbackServer(Handler handler)
    : _implementation(std::make_unique<Implementation>(std::make_unique<httplib::Server>(), "http",
                                                       std::move(handler))) {}

LoopbackServer::LoopbackServer(const signing::TLSIdentity& identity, Handler handler)
    : _implementation(
          std::make_unique<Implementation>(makeTLSServer(identity), "https", std::move(handler))) {}

LoopbackServer::~LoopbackServer() = default;

int LoopbackServer::port() const { return _implementation->port(); }

std::string LoopbackServer::url(const std::string& path) const { return _implementation->url(path); }

std::vector<ReceivedRequest> LoopbackServer::requests() const { return _implementation->requests(); }

bool LoopbackServer::waitForRequests(std::size_t count) const {
  return _implementation->waitForRequests(count);
}

std::size_t LoopbackServer::connectionCount() const {
  std::set<int> ports;
  for (const ReceivedRequest& request : requests()) ports.insert(request.remotePort);
  return ports.size();
}

signing::TLSIdentity loopbackIdentity(const signing::CertificateAuthority& authority) {
  return authority.issue({"DNS:localhost", "IP:127.0.0.1"});
}

}  // namespace tallyd::test
