#include "tally-storebag/BagFile.h"

#include <fmt/format.h>

#include <stdexcept>

#include "platform/Base64.h"
#include "platform/property-list/PropertyList.h"
#include "tally-storebag/Files.h"

namespace tallyd::storebagtool {

using platform::Dictionary;

namespace {

[[noreturn]] void fail(const std::string& name, std::string_view reason) {
  throw std::runtime_error(fmt::format("{}: {}", name, reason));
}

Dictionary parsed(std::string_view bytes, const std::string& name) {
  const auto list = platform::propertyListWithData(bytes);
  if (!list.value) fail(name, list.error);
  const Dictionary* dictionary = list.value->dictionary();
  if (!dictionary) fail(name, "the property list is not a dictionary");
  return *dictionary;
}

bool isEnvelope(const Dictionary& dictionary) {
  return dictionary.string("bag") && dictionary.contains("signature");
}

}  // namespace

BagFile bagFromBytes(std::string_view bytes, const std::string& name) {
  const Dictionary outer = parsed(bytes, name);
  if (!isEnvelope(outer)) return {outer, false};
  const auto inner = platform::base64DecodedIgnoringUnknown(*outer.string("bag"));
  if (!inner) fail(name, "the envelope's \"bag\" is not base64");
  return {parsed(*inner, name + ", \"bag\""), true};
}

BagFile readBagFile(const std::filesystem::path& path) { return bagFromBytes(readFile(path), path.string()); }

}  // namespace tallyd::storebagtool
