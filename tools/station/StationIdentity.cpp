#include "station/StationIdentity.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <stdexcept>

#include "signing/CertificateAuthority.h"
#include "signing/StorebagSigning.h"
#include "station/Files.h"

namespace tallyd::station {

namespace {

constexpr mode_t kPublic = 0644;
constexpr mode_t kPrivate = 0600;

signing::OpenSSLPointer<EVP_PKEY> readStorebagKey(const std::filesystem::path& file) {
  try {
    auto key = signing::privateKeyFromPEM(readFile(file));
    if (EVP_PKEY_get_base_id(key.get()) != EVP_PKEY_RSA) throw std::runtime_error("not an RSA key");
    return key;
  } catch (const std::system_error&) {
    throw;  // It names the file.
  } catch (const std::exception& exception) {
    throw std::runtime_error(fmt::format("{}: {}", file.string(), exception.what()));
  }
}

}  // namespace

StationIdentity::StationIdentity(const std::filesystem::path& directory)
    : _certificateFile(directory / "station.pem"), _certificateKeyFile(directory / "station-key.pem") {
  std::filesystem::create_directories(directory);
  prepareStorebagKey(directory);
  prepareCertificate(directory);
}

void StationIdentity::prepareStorebagKey(const std::filesystem::path& directory) {
  const std::filesystem::path file = directory / "storebag-key.pem";
  if (!std::filesystem::exists(file))
    replaceFile(file, signing::privateKeyPEM(signing::makeStorebagKey().get()), kPrivate);
  _storebagKey = readStorebagKey(file);

  const std::filesystem::path publicFile = directory / "publicKey.der";
  const std::string der = signing::publicKeyDER(_storebagKey.get());
  if (!std::filesystem::exists(publicFile) || readFile(publicFile) != der)
    replaceFile(publicFile, der, kPublic);
}

void StationIdentity::prepareCertificate(const std::filesystem::path& directory) const {
  const std::filesystem::path authorityFile = directory / "ca.pem";
  const std::array<std::filesystem::path, 3> files{authorityFile, _certificateFile, _certificateKeyFile};
  const auto exists = [](const std::filesystem::path& file) { return std::filesystem::exists(file); };
  if (std::all_of(files.begin(), files.end(), exists)) {
    // The TLS library opens them by name and would wait for a pipe.
    for (const auto& file : files) (void)readFile(file);
    return;
  }
  if (const auto present = std::find_if(files.begin(), files.end(), exists); present != files.end()) {
    const auto missing = std::find_if_not(files.begin(), files.end(), exists);
    throw std::runtime_error(fmt::format("{} is missing; remove {} and its like too, to have new ones made",
                                         missing->string(), present->filename().string()));
  }
  const signing::CertificateAuthority authority("tally-station");
  const signing::TLSIdentity server = authority.issue({"DNS:localhost", "IP:127.0.0.1", "IP:::1"});
  replaceFile(authorityFile, authority.certificatePEM(), kPublic);
  replaceFile(_certificateFile, server.certificatePEM, kPublic);
  replaceFile(_certificateKeyFile, server.keyPEM, kPrivate);
}

}  // namespace tallyd::station
