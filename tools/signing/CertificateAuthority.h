// A small certificate authority for servers on this machine.
#pragma once

#include <string>
#include <vector>

#include "signing/OpenSSLObjects.h"

namespace tallyd::signing {

/// A server's certificate and private key, both PEM.
struct TLSIdentity {
  std::string certificatePEM;
  std::string keyPEM;
};

/// When a server's certificate counts: from a day ago for ten years, or until an hour ago.
enum class Validity { Current, Expired };

/// Makes certificates with EC P-256 keys (RFC 5480), good for ten years. Its own key is never written
/// anywhere: once the object is gone, nobody can issue under it.
///
/// Threading: one thread at a time. Everything throws std::runtime_error when OpenSSL fails.
class CertificateAuthority {
 public:
  explicit CertificateAuthority(const std::string& commonName);

  [[nodiscard]] const std::string& certificatePEM() const { return _certificatePEM; }

  /// A certificate for a server.
  /// @param subjectAltNames  As in OpenSSL's configuration: "DNS:localhost", "IP:127.0.0.1"; not empty.
  [[nodiscard]] TLSIdentity issue(const std::vector<std::string>& subjectAltNames,
                                  Validity validity = Validity::Current) const;

 private:
  OpenSSLPointer<EVP_PKEY> _key;
  OpenSSLPointer<X509> _certificate;
  std::string _certificatePEM;
};

}  // namespace tallyd::signing
