#include "platform/http/TrustAnchors.h"

#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/ssl.h>
#include <openssl/x509.h>

#include <string>

namespace tallyd::platform {

namespace {

std::string lastOpenSSLError() {
  const unsigned long code = ERR_peek_last_error();
  const char* reason = code == 0 ? nullptr : ERR_reason_error_string(code);
  return reason == nullptr ? "no certificate in it" : reason;
}

bool isMissing(const std::filesystem::path& file) {
  std::error_code error;
  return std::filesystem::status(file, error).type() == std::filesystem::file_type::not_found;
}

/// Adds every certificate of a PEM file; true when there was at least one and nothing was broken.
bool addCertificates(X509_STORE* store, BIO* pem) {
  int added = 0;
  while (X509* certificate = PEM_read_bio_X509(pem, nullptr, nullptr, nullptr)) {
    const bool taken = X509_STORE_add_cert(store, certificate) == 1;
    X509_free(certificate);
    if (!taken) return false;
    ++added;
  }
  const unsigned long error = ERR_peek_last_error();
  const bool ended = ERR_GET_LIB(error) == ERR_LIB_PEM && ERR_GET_REASON(error) == PEM_R_NO_START_LINE;
  return ended && added > 0;
}

}  // namespace

void TrustAnchors::StoreDeleter::operator()(x509_store_st* store) const { X509_STORE_free(store); }

TrustAnchors::TrustAnchors(std::filesystem::path additionalFile, Log& log)
    : _additionalFile(std::move(additionalFile)), _log(log) {}

TrustAnchors::~TrustAnchors() = default;

bool TrustAnchors::applyTo(ssl_ctx_st* context) {
  std::call_once(_made, [this] { _store = makeStore(); });
  if (!_store) return false;
  SSL_CTX_set1_cert_store(context, _store.get());
  return true;
}

TrustAnchors::Store TrustAnchors::makeStore() const {
  Store store(X509_STORE_new());
  if (!store) return store;
  // As libcurl sets them: an anchor need not be self-signed, and a trusted certificate beats one that was
  // sent.
  X509_STORE_set_flags(store.get(), X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN);
  X509_STORE_set_default_paths(store.get());
  addAdditionalFile(store.get());
  ERR_clear_error();
  return store;
}

void TrustAnchors::addAdditionalFile(x509_store_st* store) const {
  if (isMissing(_additionalFile)) return;
  ERR_clear_error();
  const std::unique_ptr<BIO, decltype(&BIO_free)> pem(BIO_new_file(_additionalFile.c_str(), "r"), &BIO_free);
  if (pem && addCertificates(store, pem.get())) return;
  asl_log(_log, LogLevel::Error, "Can't read certificate authorities from {}: {}", _additionalFile.string(),
          lastOpenSSLError());
}

}  // namespace tallyd::platform
