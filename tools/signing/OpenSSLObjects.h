// OpenSSL's objects with owners, and its errors as exceptions.
#pragma once

#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/x509.h>

#include <memory>
#include <string>
#include <string_view>

namespace tallyd::signing {

struct OpenSSLDeleter {
  void operator()(BIO* object) const { BIO_free(object); }
  void operator()(EVP_PKEY* object) const { EVP_PKEY_free(object); }
  void operator()(EVP_MD_CTX* object) const { EVP_MD_CTX_free(object); }
  void operator()(X509* object) const { X509_free(object); }
};
template <class T>
using OpenSSLPointer = std::unique_ptr<T, OpenSSLDeleter>;

/// Throws std::runtime_error of what failed and OpenSSL's reason, unless `succeeded`.
void requireOpenSSL(bool succeeded, const char* what);

/// A private key as unencrypted PKCS#8 PEM (RFC 7468, section 10), and back; both throw.
[[nodiscard]] std::string privateKeyPEM(EVP_PKEY* key);
[[nodiscard]] OpenSSLPointer<EVP_PKEY> privateKeyFromPEM(std::string_view pem);

/// A certificate as PEM; throws.
[[nodiscard]] std::string certificatePEM(X509* certificate);

}  // namespace tallyd::signing
