#include "support/TLSServer.h"

#include <openssl/pem.h>
#include <openssl/ssl.h>
#include <sys/socket.h>

#include <array>
#include <csignal>
#include <stdexcept>
#include <utility>

namespace tallyd::test {

struct TLSConnection::Session {
  explicit Session(SSL* made) : tls(made) {}
  ~Session() { SSL_free(tls); }
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  SSL* const tls;
};

TLSConnection::TLSConnection(RawConnection& connection, void* context)
    : _connection(connection), _session(std::make_unique<Session>(SSL_new(static_cast<SSL_CTX*>(context)))) {
  SSL_set_fd(_session->tls, connection.descriptor());
  if (SSL_accept(_session->tls) != 1) throw std::runtime_error("no handshake");
}

TLSConnection::~TLSConnection() = default;

std::string TLSConnection::nextBytes() {
  std::array<char, 16'384> buffer;
  const int count = SSL_read(_session->tls, buffer.data(), static_cast<int>(buffer.size()));
  return {buffer.data(), count > 0 ? static_cast<std::size_t>(count) : 0};
}

bool TLSConnection::writeAll(std::string_view bytes) {
  return SSL_write(_session->tls, bytes.data(), static_cast<int>(bytes.size())) > 0;
}

void TLSConnection::close() {
  SSL_shutdown(_session->tls);
  ::shutdown(_connection.descriptor(), SHUT_RDWR);
}

struct TLSServer::Context {
  explicit Context(const signing::TLSIdentity& identity) : tls(SSL_CTX_new(TLS_server_method())) {
    std::signal(SIGPIPE, SIG_IGN);  // OpenSSL writes to its sockets without a word about signals.
    const signing::OpenSSLPointer<BIO> pem(
        BIO_new_mem_buf(identity.certificatePEM.data(), static_cast<int>(identity.certificatePEM.size())));
    const signing::OpenSSLPointer<X509> certificate(PEM_read_bio_X509(pem.get(), nullptr, nullptr, nullptr));
    const auto key = signing::privateKeyFromPEM(identity.keyPEM);
    if (SSL_CTX_use_certificate(tls, certificate.get()) != 1 || SSL_CTX_use_PrivateKey(tls, key.get()) != 1) {
      throw std::runtime_error("an identity that can't be used");
    }
  }
  ~Context() { SSL_CTX_free(tls); }
  Context(const Context&) = delete;
  Context& operator=(const Context&) = delete;

  SSL_CTX* const tls;
};

TLSServer::TLSServer(const signing::TLSIdentity& identity, Script script)
    : _context(std::make_shared<const Context>(identity)),
      _server(std::make_unique<RawServer>([this, script = std::move(script)](RawConnection& connection) {
        try {
          TLSConnection secured(connection, context()->tls);
          script(secured);
        } catch (const std::runtime_error&) {
          // The client wants nothing of this server: what the test sees is its side.
        }
      })) {}

TLSServer::~TLSServer() = default;

void TLSServer::setIdentity(const signing::TLSIdentity& identity) {
  auto context = std::make_shared<const Context>(identity);
  const std::lock_guard lock(_mutex);
  _context = std::move(context);
}

std::shared_ptr<const TLSServer::Context> TLSServer::context() const {
  const std::lock_guard lock(_mutex);
  return _context;
}

std::string TLSServer::url(const std::string& path) const { return "https" + _server->url(path).substr(4); }

}  // namespace tallyd::test
