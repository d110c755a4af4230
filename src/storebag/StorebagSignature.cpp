#include "storebag/StorebagSignature.h"

#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

namespace tallyd {

namespace {

const unsigned char* bytesOf(std::string_view text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}

EVP_PKEY* parseKey(std::string_view der) {
  const unsigned char* start = bytesOf(der);
  if (EVP_PKEY* key = d2i_PUBKEY(nullptr, &start, static_cast<long>(der.size()))) return key;
  start = bytesOf(der);
  return d2i_PublicKey(EVP_PKEY_RSA, nullptr, &start, static_cast<long>(der.size()));
}

}  // namespace

std::optional<StorebagPublicKey> StorebagPublicKey::fromDER(std::string_view der) {
  std::shared_ptr<EVP_PKEY> key(parseKey(der), EVP_PKEY_free);
  ERR_clear_error();  // What a refused form left behind concerns nobody else.
  if (!key || EVP_PKEY_get_base_id(key.get()) != EVP_PKEY_RSA) return std::nullopt;
  return StorebagPublicKey(key);
}

bool verifyStorebagSignature(const StorebagPublicKey& key, std::string_view bag, std::string_view signature) {
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  EVP_PKEY_CTX* parameters = nullptr;  // Owned by the context.
  const bool ready = context &&
                     EVP_DigestVerifyInit(context.get(), &parameters, EVP_sha1(), nullptr,
                                          static_cast<EVP_PKEY*>(key.get())) == 1 &&
                     EVP_PKEY_CTX_set_rsa_padding(parameters, RSA_PKCS1_PADDING) == 1;
  const bool valid = ready && EVP_DigestVerify(context.get(), bytesOf(signature), signature.size(),
                                               bytesOf(bag), bag.size()) == 1;
  ERR_clear_error();
  return valid;
}

}  // namespace tallyd
