#include "signing/OpenSSLObjects.h"

#include <openssl/err.h>
#include <openssl/pem.h>

#include <stdexcept>

namespace tallyd::signing {

namespace {

OpenSSLPointer<BIO> memoryBIO() {
  OpenSSLPointer<BIO> bio(BIO_new(BIO_s_mem()));
  requireOpenSSL(bio != nullptr, "making a buffer");
  return bio;
}

std::string contents(BIO* bio) {
  char* bytes = nullptr;
  const long size = BIO_get_mem_data(bio, &bytes);
  return {bytes, static_cast<std::size_t>(size)};
}

}  // namespace

void requireOpenSSL(bool succeeded, const char* what) {
  if (succeeded) return;
  const unsigned long code = ERR_peek_last_error();
  const char* reason = code == 0 ? nullptr : ERR_reason_error_string(code);
  ERR_clear_error();
  throw std::runtime_error(std::string(what) + " failed" +
                           (reason == nullptr ? "" : std::string(": ") + reason));
}

std::string privateKeyPEM(EVP_PKEY* key) {
  const auto bio = memoryBIO();
  const int written = PEM_write_bio_PKCS8PrivateKey(bio.get(), key, nullptr, nullptr, 0, nullptr, nullptr);
  requireOpenSSL(written == 1, "writing a private key");
  return contents(bio.get());
}

OpenSSLPointer<EVP_PKEY> privateKeyFromPEM(std::string_view pem) {
  const OpenSSLPointer<BIO> bio(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())));
  requireOpenSSL(bio != nullptr, "making a buffer");
  OpenSSLPointer<EVP_PKEY> key(PEM_read_bio_PrivateKey(bio.get(), nullptr, nullptr, nullptr));
  requireOpenSSL(key != nullptr, "reading the private key");
  return key;
}

std::string certificatePEM(X509* certificate) {
  const auto bio = memoryBIO();
  requireOpenSSL(PEM_write_bio_X509(bio.get(), certificate) == 1, "writing a certificate");
  return contents(bio.get());
}

}  // namespace tallyd::signing
