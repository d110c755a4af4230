#include "platform/Randomness.h"

#include <fmt/format.h>

namespace tallyd::platform {

double uniformDraw(Randomness& randomness) {
  constexpr int kRandomBytes = 6;  // All that stand before the UUID's version.
  const UUIDBytes uuid = randomness.uuid();
  double draw = 0;
  for (int i = kRandomBytes - 1; i >= 0; --i) draw = (draw + uuid[static_cast<std::size_t>(i)]) / 256;
  return draw;
}

std::string uuidText(const UUIDBytes& uuid) {
  std::string text;
  for (std::size_t i = 0; i < uuid.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    fmt::format_to(std::back_inserter(text), "{:02X}", uuid[i]);
  }
  return text;
}

}  // namespace tallyd::platform
