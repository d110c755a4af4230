#include "signing/StorebagSigning.h"

#include <openssl/rsa.h>

#include <stdexcept>

#include "platform/Base64.h"

namespace tallyd::signing {

using platform::base64Encoded;
using platform::Dictionary;
using platform::PropertyListFormat;
using platform::Value;

namespace {

std::string written(const Value& value, PropertyListFormat format) {
  auto bytes = platform::dataWithPropertyList(value, format);
  if (!bytes) throw std::runtime_error("the bag can't be written as a property list");
  return *std::move(bytes);
}

}  // namespace

OpenSSLPointer<EVP_PKEY> makeStorebagKey(unsigned bits) {
  OpenSSLPointer<EVP_PKEY> key(EVP_RSA_gen(bits));
  requireOpenSSL(key != nullptr, "making an RSA key");
  return key;
}

void requireStorebagKey(EVP_PKEY* key) {
  if (EVP_PKEY_get_base_id(key) != EVP_PKEY_RSA) throw std::runtime_error("is no RSA key");
  if (EVP_PKEY_get_bits(key) < static_cast<int>(kStorebagKeyBits))
    throw std::runtime_error("is shorter than 2048 bits");
}

std::string publicKeyDER(EVP_PKEY* key) {
  unsigned char* bytes = nullptr;
  const int size = i2d_PUBKEY(key, &bytes);
  requireOpenSSL(size > 0, "writing a public key");
  std::string der(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(size));
  OPENSSL_free(bytes);
  return der;
}

std::string storebagSignature(EVP_PKEY* key, std::string_view bytes) {
  const OpenSSLPointer<EVP_MD_CTX> context(EVP_MD_CTX_new());
  requireOpenSSL(context != nullptr, "making a signing context");
  EVP_PKEY_CTX* keyContext = nullptr;
  const bool ready = EVP_DigestSignInit(context.get(), &keyContext, EVP_sha1(), nullptr, key) == 1 &&
                     EVP_PKEY_CTX_set_rsa_padding(keyContext, RSA_PKCS1_PADDING) == 1;
  requireOpenSSL(ready, "preparing a signature");
  std::string signature(static_cast<std::size_t>(EVP_PKEY_get_size(key)), '\0');
  std::size_t size = signature.size();
  const int signedBytes =
      EVP_DigestSign(context.get(), reinterpret_cast<unsigned char*>(signature.data()), &size,
                     reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
  requireOpenSSL(signedBytes == 1, "signing");
  signature.resize(size);
  return signature;
}

std::string signedStorebag(EVP_PKEY* key, const Value& bag, PropertyListFormat format) {
  const std::string bytes = written(bag, format);
  const Dictionary envelope{{"signature", base64Encoded(storebagSignature(key, bytes))},
                            {"bag", base64Encoded(bytes)}};
  return written(envelope, PropertyListFormat::XML);
}

}  // namespace tallyd::signing
