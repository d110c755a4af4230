// keygen, sign, verify: what the tool signs, the daemon's code believes.

#include <openssl/ec.h>
#include <openssl/evp.h>
#include <sys/stat.h>

#include "StorebagToolFixture.h"
#include "signing/OpenSSLObjects.h"

namespace tallyd::storebagtool {
namespace {

using testing::HasSubstr;

class KeyCommandsTest : public StorebagToolTest {
 protected:
  KeyCommandsTest() {
    EXPECT_EQ(run({"keygen", path("keys")}), 0) << _err;
    _bag = write("bag.plist", bagWithClients({clientEntry()}));
  }
  [[nodiscard]] std::string privateKey() const { return path("keys/privateKey.pem"); }
  [[nodiscard]] std::string publicKey() const { return path("keys/publicKey.der"); }
  int sign(const std::string& bag, const std::string& out) {
    return run({"sign", bag, "--key", privateKey(), "-o", out});
  }
  int verify(const std::string& envelope) { return run({"verify", envelope, "--public-key", publicKey()}); }

  std::string _bag;
};

mode_t modeOf(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(::stat(path.c_str(), &status), 0) << path;
  return status.st_mode & 0777;
}

TEST_F(KeyCommandsTest, KeepsThePrivateKeyForItsOwner) {
  EXPECT_EQ(modeOf(privateKey()), 0600U);
  EXPECT_EQ(modeOf(publicKey()), 0644U);
}

TEST_F(KeyCommandsTest, LeavesKeysThatAreThereAlone) {
  const std::string before = fileText(privateKey());
  EXPECT_EQ(run({"keygen", path("keys")}), 1);
  EXPECT_THAT(_err, HasSubstr(privateKey() + " is there already"));
  std::filesystem::remove(privateKey());
  EXPECT_EQ(run({"keygen", path("keys")}), 1);  // The public key alone holds it back, too.
  EXPECT_FALSE(std::filesystem::exists(privateKey()));
  EXPECT_EQ(run({"keygen", path("keys"), "--force"}), 0);
  EXPECT_NE(fileText(privateKey()), before);
  EXPECT_EQ(modeOf(privateKey()), 0600U);
}

TEST_F(KeyCommandsTest, TakesTheFilesByName) {
  EXPECT_EQ(run({"keygen", "--private", path("a"), "--public", path("b")}), 0) << _err;
  EXPECT_TRUE(std::filesystem::exists(path("a")));
  EXPECT_TRUE(std::filesystem::exists(path("b")));
  EXPECT_EQ(run({"keygen", "--private", path("c")}), 2);
  EXPECT_EQ(run({"keygen"}), 2);
  EXPECT_EQ(run({"keygen", path("d"), "--bits", "1024"}), 2);
}

TEST_F(KeyCommandsTest, SignsWhatTheDaemonBelieves) {
  for (const char* format : {"xml", "binary"}) {
    EXPECT_EQ(run({"sign", _bag, "--key", privateKey(), "-o", path("envelope"), "--format", format}), 0)
        << _err;
    EXPECT_EQ(_err, "");
    EXPECT_EQ(verify(path("envelope")), 0) << _err;
    EXPECT_EQ(_out, path("envelope") + ": the signature holds\n");
  }
}

TEST_F(KeyCommandsTest, SignsTheSameBagToTheSameEnvelope) {
  EXPECT_EQ(sign(_bag, path("one")), 0);
  EXPECT_EQ(sign(_bag, path("two")), 0);
  EXPECT_EQ(fileText(path("one")), fileText(path("two")));
  EXPECT_EQ(sign(path("one"), path("three")), 0);  // An envelope's bag is signed anew.
  EXPECT_EQ(fileText(path("one")), fileText(path("three")));
}

TEST_F(KeyCommandsTest, SaysWhatIsWrongWithTheBagThatItSigns) {
  const auto bag = write("bad.plist", bagWithClients({without(clientEntry(), "filters")}));
  EXPECT_EQ(sign(bag, path("envelope")), 0);
  EXPECT_THAT(_err, HasSubstr("error release/splunk/clients[0]/filters: is missing; reporting is off"));
}

TEST_F(KeyCommandsTest, SignsOnlyWithLongRSAKeys) {
  const signing::OpenSSLPointer<EVP_PKEY> curve(EVP_EC_gen("P-256"));
  const signing::OpenSSLPointer<EVP_PKEY> shortKey(EVP_RSA_gen(1024));
  const auto refused = [&](EVP_PKEY* key) {
    const auto file = write("other.pem", signing::privateKeyPEM(key));
    EXPECT_EQ(run({"sign", _bag, "--key", file, "-o", path("envelope")}), 1);
    EXPECT_THAT(_err, HasSubstr(file));
    return _err;
  };
  EXPECT_THAT(refused(curve.get()), HasSubstr("is no RSA key"));
  EXPECT_THAT(refused(shortKey.get()), HasSubstr("is shorter than 2048 bits"));
  EXPECT_EQ(run({"sign", _bag, "--key", _bag, "-o", path("envelope")}), 1);
  EXPECT_THAT(_err, HasSubstr(_bag));
  EXPECT_FALSE(std::filesystem::exists(path("envelope")));
}

TEST_F(KeyCommandsTest, SaysWhyAnEnvelopeIsNotBelieved) {
  EXPECT_EQ(sign(_bag, path("envelope")), 0);
  EXPECT_EQ(run({"keygen", path("other")}), 0);
  EXPECT_EQ(run({"verify", path("envelope"), "--public-key", path("other/publicKey.der")}), 1);
  EXPECT_THAT(_err, HasSubstr(path("envelope") + ": Signature can not be verified\n"));
  EXPECT_EQ(run({"verify", path("envelope"), "--public-key", _bag}), 1);
  EXPECT_THAT(_err, HasSubstr("the public key is no RSA key"));
  EXPECT_EQ(verify(_bag), 1);
  EXPECT_THAT(_err, HasSubstr("Signature is missing"));
  EXPECT_EQ(verify(write("garbage", std::string("\x01\x02"))), 1);
  EXPECT_THAT(_err, HasSubstr("propertyListWithData error"));
  EXPECT_EQ(verify(path("nowhere")), 1);
  EXPECT_THAT(_err, HasSubstr(path("nowhere")));
}

TEST_F(KeyCommandsTest, SaysWhichPartOfTheEnvelopeIsBroken) {
  EXPECT_EQ(verify(write("e", Dictionary{{"signature", "abc"}, {"bag", "YWJj"}})), 1);
  EXPECT_THAT(_err, HasSubstr("\"signature\" is not base64"));
  EXPECT_EQ(verify(write("e", Dictionary{{"signature", "YWJj"}})), 1);
  EXPECT_THAT(_err, HasSubstr("\"bag\" is missing or not base64"));
}

}  // namespace
}  // namespace tallyd::storebagtool
