#include "support/NginxProxy.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <spawn.h>
#include <sys/wait.h>
#include <csignal>

#include <array>
#include <fstream>
#include <stdexcept>

#include "support/RawServer.h"

namespace tallyd::test {

namespace {

constexpr const char* kProgram = "/usr/sbin/nginx";

// Arguments: folder, port, upstream port, user line.
constexpr const char* kConfiguration = R"(daemon off;
{3}
pid {0}/nginx.pid;
error_log {0}/error.log info;
events {{ worker_connections 64; }}
http {{
  access_log off;
  client_body_temp_path {0}/body;
  proxy_temp_path {0}/proxy;
  fastcgi_temp_path {0}/fastcgi;
  uwsgi_temp_path {0}/uwsgi;
  scgi_temp_path {0}/scgi;
  server {{
    listen 127.0.0.1:{1} ssl http2;
    ssl_certificate {0}/server.pem;
    ssl_certificate_key {0}/key.pem;
    location / {{
      proxy_pass http://127.0.0.1:{2};
      proxy_set_header X-Front-Connection $connection;
      proxy_set_header X-Front-Protocol $server_protocol;
    }}
  }}
}}
)";

void writeFile(const std::filesystem::path& path, const std::string& text) { std::ofstream(path) << text; }

}  // namespace

NginxProxy::NginxProxy(const signing::TLSIdentity& identity, int upstreamPort) {
  const platform::FileDescriptor listener = listenOnLoopback();
  _port = portOf(listener.get());
  writeConfiguration(identity, upstreamPort);
  startProcess(listener);
}

NginxProxy::~NginxProxy() {
  ::kill(_process, SIGTERM);
  ::waitpid(_process, nullptr, 0);
}

bool NginxProxy::isInstalled() { return ::access(kProgram, X_OK) == 0; }

std::string NginxProxy::url(const std::string& path) const {
  return "https://127.0.0.1:" + std::to_string(_port) + path;
}

void NginxProxy::writeConfiguration(const signing::TLSIdentity& identity, int upstreamPort) const {
  writeFile(_folder.path() / "server.pem", identity.certificatePEM);
  writeFile(_folder.path() / "key.pem", identity.keyPEM);
  writeFile(_folder.path() / "nginx.conf",
            fmt::format(fmt::runtime(kConfiguration), _folder.path().string(), _port, upstreamPort,
                        ::geteuid() == 0 ? "user root;" : ""));
}

void NginxProxy::startProcess(const platform::FileDescriptor& listener) {
  // nginx takes over listening sockets that its environment names, as it does when one binary replaces
  // another. The socket listens already, so that nobody has to wait until nginx is ready.
  const platform::FileDescriptor passed(::fcntl(listener.get(), F_DUPFD, 3));
  std::string sockets = fmt::format("NGINX={};", passed.get());
  const std::string folder = _folder.path().string();
  const std::string configuration = folder + "/nginx.conf";
  const std::string errors = folder + "/error.log";
  std::array<const char*, 8> arguments{kProgram, "-p",           folder.c_str(), "-c", configuration.c_str(),
                                       "-e",     errors.c_str(), nullptr};
  std::array<char*, 2> environment{sockets.data(), nullptr};
  const int error = ::posix_spawn(&_process, kProgram, nullptr, nullptr, const_cast<char**>(arguments.data()),
                                  environment.data());
  if (error != 0) throw std::runtime_error("can't start nginx");
}

}  // namespace tallyd::test
