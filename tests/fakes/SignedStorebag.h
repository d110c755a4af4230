// A storebag server's signing side: key pairs, signatures, envelopes.
#pragma once

#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>

#include "platform/Base64.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::fakes {

/// A private key, made at its first use and kept for the life of the process.
class StorebagSigner {
 public:
  /// The server whose public key clients carry.
  static const StorebagSigner& server() {
    static const StorebagSigner signer;
    return signer;
  }
  /// Someone else with a key of the same kind.
  static const StorebagSigner& stranger() {
    static const StorebagSigner signer;
    return signer;
  }

  [[nodiscard]] std::string subjectPublicKeyInfo() const { return der(i2d_PUBKEY); }
  [[nodiscard]] std::string rsaPublicKey() const { return der(i2d_PublicKey); }

  /// RSASSA-PKCS1-v1_5 over the bytes, with SHA-1 unless another digest is asked for.
  [[nodiscard]] std::string signature(std::string_view bytes, const EVP_MD* digest = EVP_sha1()) const {
    const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
    std::string result(static_cast<std::size_t>(EVP_PKEY_get_size(_key.get())), '\0');
    std::size_t length = result.size();
    check(EVP_DigestSignInit(context.get(), nullptr, digest, nullptr, _key.get()));
    check(EVP_DigestSign(context.get(), reinterpret_cast<unsigned char*>(result.data()), &length,
                         reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size()));
    result.resize(length);
    return result;
  }

  /// The response body for a bag, signed.
  [[nodiscard]] std::string envelope(const platform::Value& bag) const {
    return envelopeOfBytes(*platform::dataWithPropertyList(bag, platform::PropertyListFormat::XML));
  }
  /// The same for bytes that need not be a property list.
  [[nodiscard]] std::string envelopeOfBytes(std::string_view bag) const {
    return envelopeOf(platform::base64Encoded(signature(bag)), platform::base64Encoded(bag));
  }
  /// An envelope with whatever is given under "signature" and "bag".
  [[nodiscard]] static std::string envelopeOf(platform::Value signature, platform::Value bag) {
    const platform::Dictionary envelope{{"signature", std::move(signature)}, {"bag", std::move(bag)}};
    return *platform::dataWithPropertyList(envelope, platform::PropertyListFormat::XML);
  }

 private:
  // Short keys: they are made anew by each test process and guard nothing.
  StorebagSigner() : _key(EVP_RSA_gen(1024), EVP_PKEY_free) {
    if (!_key) throw std::runtime_error("no RSA key pair");
  }

  static void check(int result) {
    if (result != 1) throw std::runtime_error("signing failed");
  }
  template <class Encode>
  std::string der(Encode encode) const {
    unsigned char* bytes = nullptr;
    const int length = encode(_key.get(), &bytes);
    if (length <= 0) throw std::runtime_error("no DER of the key");
    std::string text(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(length));
    OPENSSL_free(bytes);
    return text;
  }

  std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> _key;
};

}  // namespace tallyd::fakes
