// nginx as an HTTP/2 and TLS front of a loopback server.
#pragma once

#include <sys/types.h>

#include <string>

#include "fakes/TemporaryFolder.h"
#include "platform/FileDescriptor.h"
#include "signing/CertificateAuthority.h"

namespace tallyd::test {

/// Passes every request on to a plain HTTP server and adds two headers: "X-Front-Connection", the number of
/// the connection that it came over, and "X-Front-Protocol", such as "HTTP/2.0". One process, ended with this
/// object.
class NginxProxy {
 public:
  NginxProxy(const signing::TLSIdentity& identity, int upstreamPort);
  ~NginxProxy();
  NginxProxy(const NginxProxy&) = delete;
  NginxProxy& operator=(const NginxProxy&) = delete;

  [[nodiscard]] static bool isInstalled();
  [[nodiscard]] std::string url(const std::string& path = "/") const;

 private:
  void writeConfiguration(const signing::TLSIdentity& identity, int upstreamPort) const;
  void startProcess(const platform::FileDescriptor& listener);

  fakes::TemporaryFolder _folder;
  int _port = 0;
  pid_t _process = -1;
};

}  // namespace tallyd::test
