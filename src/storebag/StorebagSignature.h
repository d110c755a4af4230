// The signature that makes a storebag believable.
#pragma once

#include <memory>
#include <optional>
#include <string_view>

namespace tallyd {

/// An RSA public key. Threading: may be used by one thread at a time.
class StorebagPublicKey {
 public:
  /// From DER bytes: a SubjectPublicKeyInfo (RFC 5280, section 4.1) or an RSAPublicKey (RFC 8017, appendix
  /// A.1.1). Nothing when they hold no RSA key.
  [[nodiscard]] static std::optional<StorebagPublicKey> fromDER(std::string_view der);

  [[nodiscard]] void* get() const { return _key.get(); }

 private:
  explicit StorebagPublicKey(std::shared_ptr<void> key) : _key(std::move(key)) {}
  std::shared_ptr<void> _key;  // An EVP_PKEY; its type stays out of the header.
};

/// Whether `signature` is the key's RSASSA-PKCS1-v1_5 signature (RFC 8017, section 8.2) with SHA-1 over
/// `bag`.
[[nodiscard]] bool verifyStorebagSignature(const StorebagPublicKey& key, std::string_view bag,
                                           std::string_view signature);

}  // namespace tallyd
