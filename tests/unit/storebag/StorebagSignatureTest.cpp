#include "storebag/StorebagSignature.h"

#include <gtest/gtest.h>
#include <openssl/err.h>

#include "fakes/SignedStorebag.h"

namespace tallyd {
namespace {

using fakes::StorebagSigner;

const StorebagSigner& server() { return StorebagSigner::server(); }

StorebagPublicKey serverKey() { return *StorebagPublicKey::fromDER(server().subjectPublicKeyInfo()); }

/// A SubjectPublicKeyInfo of a key that is not RSA's.
std::string ellipticCurveKey() {
  EVP_PKEY* key = EVP_EC_gen("P-256");
  unsigned char* bytes = nullptr;
  const int length = i2d_PUBKEY(key, &bytes);
  std::string der(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(length));
  OPENSSL_free(bytes);
  EVP_PKEY_free(key);
  return der;
}

TEST(StorebagSignatureTest, AcceptsTheServersSignature) {
  EXPECT_TRUE(verifyStorebagSignature(serverKey(), "bag", server().signature("bag")));
}

TEST(StorebagSignatureTest, AcceptsASignatureOverNoBytesAndOverManyBytes) {
  const std::string many(1 << 20, '\0');
  EXPECT_TRUE(verifyStorebagSignature(serverKey(), "", server().signature("")));
  EXPECT_TRUE(verifyStorebagSignature(serverKey(), many, server().signature(many)));
}

TEST(StorebagSignatureTest, ReadsTheKeyInBothForms) {
  const auto info = StorebagPublicKey::fromDER(server().subjectPublicKeyInfo());
  const auto bare = StorebagPublicKey::fromDER(server().rsaPublicKey());
  ASSERT_TRUE(info);
  ASSERT_TRUE(bare);
  EXPECT_NE(server().subjectPublicKeyInfo(), server().rsaPublicKey());
  EXPECT_TRUE(verifyStorebagSignature(*info, "bag", server().signature("bag")));
  EXPECT_TRUE(verifyStorebagSignature(*bare, "bag", server().signature("bag")));
}

TEST(StorebagSignatureTest, RefusesBytesThatAreNoRSAKey) {
  EXPECT_FALSE(StorebagPublicKey::fromDER(""));
  EXPECT_FALSE(StorebagPublicKey::fromDER("not a key"));
  EXPECT_FALSE(StorebagPublicKey::fromDER(server().subjectPublicKeyInfo().substr(0, 80)));
  EXPECT_FALSE(StorebagPublicKey::fromDER(ellipticCurveKey()));
}

TEST(StorebagSignatureTest, RefusesASignatureOfOtherBytes) {
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", server().signature("bag ")));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "", server().signature("bag")));
}

TEST(StorebagSignatureTest, RefusesASignatureOfAnotherKey) {
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", StorebagSigner::stranger().signature("bag")));
}

TEST(StorebagSignatureTest, RefusesASignatureWithAnotherDigest) {
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", server().signature("bag", EVP_sha256())));
}

TEST(StorebagSignatureTest, RefusesASignatureOfTheWrongLength) {
  const std::string signature = server().signature("bag");
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", ""));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", "x"));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", signature.substr(1)));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", signature + '\0'));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", '\0' + signature));
}

TEST(StorebagSignatureTest, RefusesASignatureWithOneBitChanged) {
  std::string signature = server().signature("bag");
  signature[signature.size() / 2] = static_cast<char>(signature[signature.size() / 2] ^ 1);
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", signature));
}

TEST(StorebagSignatureTest, LeavesNoErrorBehindForTheThreadsNextUserOfTheLibrary) {
  EXPECT_FALSE(StorebagPublicKey::fromDER("not a key"));
  EXPECT_FALSE(verifyStorebagSignature(serverKey(), "bag", "x"));
  EXPECT_EQ(ERR_peek_error(), 0U);
}

}  // namespace
}  // namespace tallyd
