#include "signing/StorebagSigning.h"

#include <gtest/gtest.h>
#include <openssl/rsa.h>
#include <openssl/sha.h>

#include <array>

#include "platform/Base64.h"

namespace tallyd::signing {

using platform::Dictionary;
using platform::PropertyListFormat;
using platform::propertyListWithData;
using platform::Value;

namespace {

/// As a client verifies: the digest on its own, against the key that the DER bytes hold.
bool verifies(const std::string& der, std::string_view bytes, const std::string& signature) {
  const auto* at = reinterpret_cast<const unsigned char*>(der.data());
  const OpenSSLPointer<EVP_PKEY> key(d2i_PUBKEY(nullptr, &at, static_cast<long>(der.size())));
  if (!key) return false;
  std::array<unsigned char, SHA_DIGEST_LENGTH> digest{};
  SHA1(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size(), digest.data());
  EVP_PKEY_CTX* context = EVP_PKEY_CTX_new(key.get(), nullptr);
  const bool valid = EVP_PKEY_verify_init(context) == 1 &&
                     EVP_PKEY_CTX_set_rsa_padding(context, RSA_PKCS1_PADDING) == 1 &&
                     EVP_PKEY_CTX_set_signature_md(context, EVP_sha1()) == 1 &&
                     EVP_PKEY_verify(context, reinterpret_cast<const unsigned char*>(signature.data()),
                                     signature.size(), digest.data(), digest.size()) == 1;
  EVP_PKEY_CTX_free(context);
  return valid;
}

}  // namespace

TEST(StorebagSigningTest, SignsTheBytesThatTheEnvelopeHolds) {
  const auto key = makeStorebagKey();
  const Value bag =
      Dictionary{{"version", "12"}, {"release", Dictionary{{"backends", Value(platform::Array{"a"})}}}};
  for (const auto format : {PropertyListFormat::XML, PropertyListFormat::Binary}) {
    const auto envelope = propertyListWithData(signedStorebag(key.get(), bag, format)).value;
    ASSERT_TRUE(envelope && envelope->dictionary());
    const auto bytes =
        platform::base64DecodedIgnoringUnknown(envelope->dictionary()->string("bag").value_or(""));
    const auto signature =
        platform::base64DecodedIgnoringUnknown(envelope->dictionary()->string("signature").value_or(""));
    ASSERT_TRUE(bytes && signature);
    EXPECT_EQ(propertyListWithData(*bytes).value, bag);
    EXPECT_EQ(bytes->starts_with("bplist00"), format == PropertyListFormat::Binary);
    EXPECT_EQ(signature->size(), 256U);
    EXPECT_TRUE(verifies(publicKeyDER(key.get()), *bytes, *signature));
    EXPECT_FALSE(verifies(publicKeyDER(key.get()), *bytes + " ", *signature));
    EXPECT_FALSE(verifies(publicKeyDER(makeStorebagKey().get()), *bytes, *signature));
  }
}

TEST(StorebagSigningTest, RefusesABagThatNoPropertyListHolds) {
  const auto key = makeStorebagKey();
  EXPECT_THROW(
      static_cast<void>(signedStorebag(key.get(), Dictionary{{"version", nullptr}}, PropertyListFormat::XML)),
      std::runtime_error);
}

}  // namespace tallyd::signing
