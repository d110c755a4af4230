// The certificate authorities that servers are checked against.
#pragma once

#include <filesystem>
#include <memory>
#include <mutex>

#include "platform/Log.h"

struct ssl_ctx_st;     // OpenSSL's SSL_CTX
struct x509_store_st;  // OpenSSL's X509_STORE

namespace tallyd::platform {

/// The system's authorities and those of one more file, in one store that all connections share: a connection
/// costs no reading of certificates.
///
/// The system's are looked up by name in OpenSSL's default folder when a server's chain asks for one. The
/// file is read once, at the first use.
///
/// Threading: any thread.
class TrustAnchors {
 public:
  /// Borrows `log`. Touches no file.
  TrustAnchors(std::filesystem::path additionalFile, Log& log);
  ~TrustAnchors();
  TrustAnchors(const TrustAnchors&) = delete;
  TrustAnchors& operator=(const TrustAnchors&) = delete;

  /// Makes connections of `context` check their servers against these anchors; false when memory runs out.
  [[nodiscard]] bool applyTo(ssl_ctx_st* context);

 private:
  struct StoreDeleter {
    void operator()(x509_store_st* store) const;
  };
  using Store = std::unique_ptr<x509_store_st, StoreDeleter>;

  [[nodiscard]] Store makeStore() const;
  void addAdditionalFile(x509_store_st* store) const;

  const std::filesystem::path _additionalFile;
  Log& _log;
  std::once_flag _made;
  Store _store;
};

}  // namespace tallyd::platform
