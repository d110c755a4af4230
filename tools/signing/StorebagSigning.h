// Storebags as their server signs them.
#pragma once

#include <string>
#include <string_view>

#include "platform/Value.h"
#include "platform/property-list/PropertyList.h"
#include "signing/OpenSSLObjects.h"

namespace tallyd::signing {

inline constexpr unsigned kStorebagKeyBits = 2048;  ///< The shortest that bags should be signed with.

/// A new RSA key; throws.
[[nodiscard]] OpenSSLPointer<EVP_PKEY> makeStorebagKey(unsigned bits = kStorebagKeyBits);

/// Throws std::runtime_error unless bags may be signed with the key: RSA, of kStorebagKeyBits or more.
void requireStorebagKey(EVP_PKEY* key);

/// The public half as a SubjectPublicKeyInfo (RFC 5280, section 4.1.2.7), the form of the resource
/// "publicKey.der"; throws.
[[nodiscard]] std::string publicKeyDER(EVP_PKEY* key);

/// RSASSA-PKCS1-v1_5 with SHA-1 (RFC 8017, section 8.2) over `bytes`; throws. Threading: one key may sign on
/// any threads.
[[nodiscard]] std::string storebagSignature(EVP_PKEY* key, std::string_view bytes);

/// The envelope that is served: an XML property list of "bag" (base64 of the bag's bytes, written as
/// `format`) and "signature" (base64, over those bytes). Throws when the bag can't be written.
[[nodiscard]] std::string signedStorebag(EVP_PKEY* key, const platform::Value& bag,
                                         platform::PropertyListFormat format);

}  // namespace tallyd::signing
