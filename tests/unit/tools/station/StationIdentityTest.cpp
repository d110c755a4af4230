#include "station/StationIdentity.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>
#include <sys/stat.h>

#include <map>

#include "fakes/TemporaryFolder.h"
#include "signing/StorebagSigning.h"
#include "station/Files.h"

namespace tallyd::station {

using testing::HasSubstr;

namespace {

signing::OpenSSLPointer<X509> readCertificate(const std::filesystem::path& file) {
  const std::string pem = readFile(file);
  const signing::OpenSSLPointer<BIO> bio(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())));
  return signing::OpenSSLPointer<X509>(PEM_read_bio_X509(bio.get(), nullptr, nullptr, nullptr));
}

mode_t modeOf(const std::filesystem::path& file) {
  struct stat status {};
  ::stat(file.c_str(), &status);
  return status.st_mode & 07777;
}

std::string errorOfOpening(const std::filesystem::path& directory) {
  try {
    const StationIdentity identity(directory);
    return "no error";
  } catch (const std::exception& exception) {
    return exception.what();
  }
}

}  // namespace

class StationIdentityTest : public testing::Test {
 protected:
  [[nodiscard]] std::map<std::string, std::string> contents() const {
    std::map<std::string, std::string> files;
    for (const auto& file : std::filesystem::directory_iterator(directory)) {
      files[file.path().filename()] = readFile(file.path());
    }
    return files;
  }

  fakes::TemporaryFolder folder;
  const std::filesystem::path directory = folder.path() / "new" / "station";
};

TEST_F(StationIdentityTest, MakesKeysAndCertificatesAndKeepsThem) {
  { const StationIdentity identity(directory); }
  const auto files = contents();
  EXPECT_EQ(files.size(), 5U);
  const StationIdentity identity(directory);
  EXPECT_EQ(contents(), files);
  EXPECT_EQ(signing::publicKeyDER(identity.storebagKey()), files.at("publicKey.der"));
}

TEST_F(StationIdentityTest, LetsOnlyTheOwnerReadPrivateKeys) {
  const StationIdentity identity(directory);
  EXPECT_EQ(modeOf(directory / "storebag-key.pem"), 0600U);
  EXPECT_EQ(modeOf(directory / "station-key.pem"), 0600U);
  EXPECT_EQ(modeOf(directory / "publicKey.der"), 0644U);
}

TEST_F(StationIdentityTest, CertifiesTheLoopbackNamesUnderItsAuthority) {
  const StationIdentity identity(directory);
  const auto authority = readCertificate(directory / "ca.pem");
  const auto server = readCertificate(identity.certificateFile());
  ASSERT_TRUE(authority && server);
  EXPECT_EQ(X509_verify(server.get(), X509_get0_pubkey(authority.get())), 1);
  EXPECT_EQ(X509_check_host(server.get(), "localhost", 0, 0, nullptr), 1);
  EXPECT_EQ(X509_check_ip_asc(server.get(), "127.0.0.1", 0), 1);
  EXPECT_EQ(X509_check_ip_asc(server.get(), "::1", 0), 1);
  EXPECT_NE(X509_check_host(server.get(), "storebags.quillon.example", 0, 0, nullptr), 1);
  EXPECT_EQ(X509_check_private_key(server.get(),
                                   signing::privateKeyFromPEM(readFile(identity.certificateKeyFile())).get()),
            1);
}

TEST_F(StationIdentityTest, WritesTheMissingPublicKeyAgain) {
  { const StationIdentity identity(directory); }
  const std::string der = readFile(directory / "publicKey.der");
  std::filesystem::remove(directory / "publicKey.der");
  { const StationIdentity identity(directory); }
  EXPECT_EQ(readFile(directory / "publicKey.der"), der);
}

TEST_F(StationIdentityTest, NamesTheFileAtFault) {
  { const StationIdentity identity(directory); }
  std::filesystem::remove(directory / "station.pem");
  EXPECT_THAT(errorOfOpening(directory), HasSubstr((directory / "station.pem").string()));
  replaceFile(directory / "storebag-key.pem", "no key", 0600);
  EXPECT_THAT(errorOfOpening(directory), HasSubstr((directory / "storebag-key.pem").string()));
}

TEST_F(StationIdentityTest, RefusesAStorebagKeyThatIsNotRSA) {
  { const StationIdentity identity(directory); }
  std::filesystem::copy_file(directory / "station-key.pem", directory / "storebag-key.pem",
                             std::filesystem::copy_options::overwrite_existing);
  EXPECT_THAT(errorOfOpening(directory), HasSubstr("not an RSA key"));
}

TEST_F(StationIdentityTest, DoesNotWaitForAPipe) {
  { const StationIdentity identity(directory); }
  for (const char* name : {"station.pem", "station-key.pem", "storebag-key.pem", "publicKey.der"}) {
    std::filesystem::rename(directory / name, folder.path() / "kept");
    ASSERT_EQ(::mkfifo((directory / name).c_str(), 0600), 0);
    EXPECT_THAT(errorOfOpening(directory), HasSubstr((directory / name).string() + " is not a regular file"));
    std::filesystem::rename(folder.path() / "kept", directory / name);
  }
  EXPECT_EQ(errorOfOpening(directory), "no error");
}

}  // namespace tallyd::station
