// XML property lists.
#pragma once

#include <string_view>

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

/// Reads a list of UTF-8, whatever encoding it declares; NUL and what is no UTF-8 become U+FFFD. Takes time
/// in proportion to the list's size, which must not exceed kMaximumPropertyListBytes. Refused are documents
/// that declare entities.
[[nodiscard]] PropertyListResult propertyListWithXML(std::string_view bytes);

/// Whether `bytes`, blanks before it aside, begin like an XML property list.
[[nodiscard]] bool looksLikeXML(std::string_view bytes);

}  // namespace tallyd::platform
