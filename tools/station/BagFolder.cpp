#include "station/BagFolder.h"

#include <fmt/format.h>

#include <exception>
#include <stdexcept>

#include "platform/property-list/PropertyList.h"
#include "signing/StorebagSigning.h"
#include "station/Files.h"
#include "station/HTTPStatus.h"

namespace tallyd::station {

namespace {

using platform::PropertyListFormat;
using platform::Value;

/// The bag that a file holds; throws what is wrong with it.
Value parseBag(const std::string& bytes) {
  platform::PropertyListResult parsed = platform::propertyListWithData(bytes);
  if (!parsed.value) throw std::runtime_error(parsed.error);
  const platform::Dictionary* bag = parsed.value->dictionary();
  if (bag == nullptr) throw std::runtime_error("the top level is not a dictionary");
  if (!bag->string("version")) throw std::runtime_error("\"version\" is missing or not a string");
  return *std::move(parsed.value);
}

/// Whether a name is one file's in the folder itself.
bool isPlainName(const std::string& name) {
  return !name.empty() && name.front() != '.' && name.find('/') == std::string::npos &&
         name.find('\0') == std::string::npos;
}

}  // namespace

Answer BagFolder::storebag(const std::string& name) const {
  const std::filesystem::path file = _directory / (name + ".plist");
  if (!isPlainName(name) || !std::filesystem::exists(file)) {
    return {kNotFound, fmt::format("There is no storebag \"{}\" in {}\n", name, _directory.string())};
  }
  try {
    return {kOK, signing::signedStorebag(_key, parseBag(readFile(file)), PropertyListFormat::Binary)};
  } catch (const std::exception& exception) {
    return {kServerError, fmt::format("{} is not a storebag: {}\n", file.string(), exception.what())};
  }
}

}  // namespace tallyd::station
