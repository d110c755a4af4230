#include "platform/Randomness.h"

#include <fmt/format.h>

namespace tallyd::platform {

std::string uuidText(const UUIDBytes& uuid) {
  std::string text;
  for (std::size_t i = 0; i < uuid.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    fmt::format_to(std::back_inserter(text), "{:02X}", uuid[i]);
  }
  return text;
}

}  // namespace tallyd::platform
