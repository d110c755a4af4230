#include "platform/text/UnicodeText.h"

#include <unicode/locid.h>
#include <unicode/stringpiece.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/utf16.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>

#include "platform/UTF8.h"

namespace tallyd::platform {
namespace {

char lowercasedASCII(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + ('a' - 'A')) : c; }

bool equalIgnoringASCIICase(char a, char b) { return lowercasedASCII(a) == lowercasedASCII(b); }

icu::UnicodeString unicode(std::string_view text) {
  return icu::UnicodeString::fromUTF8(icu::StringPiece(text.data(), static_cast<std::int32_t>(text.size())));
}

icu::UnicodeString folded(std::string_view text) { return unicode(text).foldCase(U_FOLD_CASE_DEFAULT); }

std::string utf8(const icu::UnicodeString& text) {
  std::string bytes;
  return text.toUTF8String(bytes);
}

}  // namespace

// Nearly all text is, and every rule of Unicode's then comes down to one on single bytes.
bool isASCII(std::string_view text) { return asciiLength(text) == text.size(); }

std::string lowercased(std::string_view text) {
  if (!isASCII(text)) return utf8(unicode(text).toLower(icu::Locale::getRoot()));
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(), lowercasedASCII);
  return result;
}

std::string caseFolded(std::string_view text) {
  return isASCII(text) ? lowercased(text) : utf8(folded(text));
}

bool equalIgnoringCase(std::string_view a, std::string_view b) {
  if (isASCII(a) && isASCII(b))
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), equalIgnoringASCIICase);
  return folded(a) == folded(b);
}

bool containsIgnoringCase(std::string_view haystack, std::string_view needle) {
  if (needle.empty()) return false;
  if (isASCII(haystack) && isASCII(needle)) {
    return std::search(haystack.begin(), haystack.end(), needle.begin(), needle.end(),
                       equalIgnoringASCIICase) != haystack.end();
  }
  return folded(haystack).indexOf(folded(needle)) >= 0;
}

std::size_t utf16Length(std::string_view text) {
  if (isASCII(text)) return text.size();
  std::size_t length = 0;
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
  for (std::size_t i = 0; i < text.size();) {
    UChar32 character = 0;
    U8_NEXT_OR_FFFD(bytes, i, text.size(), character);
    length += U16_LENGTH(character);
  }
  return length;
}

}  // namespace tallyd::platform
