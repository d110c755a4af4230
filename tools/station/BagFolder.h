// The storebags that the station serves: readable property lists in a folder.
#pragma once

#include <filesystem>
#include <string>

#include "signing/OpenSSLObjects.h"
#include "station/Answer.h"

namespace tallyd::station {

/// Serves DIR/NAME.plist, read anew at each request, as a signed storebag.
///
/// Threading: any thread.
class BagFolder {
 public:
  /// Borrows the key. The folder need not be there yet.
  BagFolder(std::filesystem::path directory, EVP_PKEY* key) : _directory(std::move(directory)), _key(key) {}

  /// 200 and the envelope; 404 for a name without a file, 500 for a file that is no bag, with its name.
  [[nodiscard]] Answer storebag(const std::string& name) const;

 private:
  const std::filesystem::path _directory;
  EVP_PKEY* const _key;
};

}  // namespace tallyd::station
