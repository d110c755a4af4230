#include "tallyctl/PlainText.h"

#include <algorithm>

#include "platform/JSON.h"
#include "platform/UTF8.h"

namespace tallyd::tallyctl {

namespace {

/// The C1 controls of ISO/IEC 6429, U+0080 to U+009F, which JSON leaves as they are.
bool isC1(std::string_view text, std::size_t index) {
  return index + 1 < text.size() && text[index] == '\xC2' &&
         static_cast<unsigned char>(text[index + 1]) < 0xA0;
}

bool isControl(char unit) {
  const auto byte = static_cast<unsigned char>(unit);
  return byte < 0x20 || byte == 0x7F;
}

std::string escaped(std::string_view text) {
  const std::string json = platform::jsonFromValue(platform::Value(text)).value_or("");
  std::string plain;
  for (std::size_t i = 0; i < json.size(); ++i) {
    if (json[i] == '\x7F') {
      plain += "\\u007f";
    } else if (isC1(json, i)) {
      constexpr std::string_view kDigits = "0123456789abcdef";
      const auto low = static_cast<unsigned char>(json[++i]);
      plain += "\\u00";
      plain += kDigits[low >> 4U];
      plain += kDigits[low & 0xFU];
    } else {
      plain += json[i];
    }
  }
  return plain;
}

}  // namespace

std::string plainText(std::string_view text) {
  std::string wellFormed = platform::withBrokenUTF8Replaced(text);
  bool isPlain = std::none_of(wellFormed.begin(), wellFormed.end(), isControl);
  for (std::size_t i = 0; isPlain && i < wellFormed.size(); ++i) isPlain = !isC1(wellFormed, i);
  return isPlain ? wellFormed : escaped(wellFormed);
}

}  // namespace tallyd::tallyctl
