// The station's keys and certificates, kept in its folder.
#pragma once

#include <filesystem>

#include "signing/OpenSSLObjects.h"

namespace tallyd::station {

/// Makes what is missing and keeps what is there:
///
///  - "storebag-key.pem", the RSA key that signs storebags (readable by its owner only), and "publicKey.der",
///  its public
///    half, for the client framework's bundle;
///  - "ca.pem", a certificate authority, for the daemon's "etc/tally/ca.pem", and "station.pem" with
///  "station-key.pem",
///    the server's certificate under it for localhost, 127.0.0.1 and ::1.
///
/// The authority's own key is not kept, so that the three files of a certificate are only made together.
class StationIdentity {
 public:
  /// Creates the folder too. Throws with a text that names the file at fault.
  explicit StationIdentity(const std::filesystem::path& directory);

  [[nodiscard]] EVP_PKEY* storebagKey() const { return _storebagKey.get(); }
  [[nodiscard]] const std::filesystem::path& certificateFile() const { return _certificateFile; }
  [[nodiscard]] const std::filesystem::path& certificateKeyFile() const { return _certificateKeyFile; }

 private:
  void prepareStorebagKey(const std::filesystem::path& directory);
  void prepareCertificate(const std::filesystem::path& directory) const;

  signing::OpenSSLPointer<EVP_PKEY> _storebagKey;
  std::filesystem::path _certificateFile;
  std::filesystem::path _certificateKeyFile;
};

}  // namespace tallyd::station
