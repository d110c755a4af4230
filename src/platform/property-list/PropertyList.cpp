#include "platform/property-list/PropertyList.h"

#include <exception>

#include "platform/property-list/ASCIIPropertyList.h"
#include "platform/property-list/BinaryPropertyList.h"
#include "platform/property-list/Limits.h"
#include "platform/property-list/XMLPropertyList.h"

namespace tallyd::platform {

namespace {

PropertyListResult readAnyForm(std::string_view bytes) {
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  if (bytes.size() > kMaximumPropertyListBytes) return {std::nullopt, "property list: too large"};
  if (bytes.starts_with(kBinaryPropertyListStart)) return propertyListWithBinary(bytes);
  if (bytes.starts_with(kByteOrderMark)) bytes.remove_prefix(kByteOrderMark.size());
  if (bytes.find_first_not_of(" \t\r\n\f\v") == std::string_view::npos)
    return {std::nullopt, "property list: empty"};
  return looksLikeXML(bytes) ? propertyListWithXML(bytes) : propertyListWithASCII(bytes);
}

}  // namespace

PropertyListResult propertyListWithData(std::string_view bytes) {
  try {
    return readAnyForm(bytes);
  } catch (const std::exception& failure) {  // No memory is the only one possible.
    return {std::nullopt, std::string("property list: ") + failure.what()};
  }
}

}  // namespace tallyd::platform
