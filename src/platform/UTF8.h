// UTF-8, one character at a time (Unicode Standard, section 3.9, table 3-7).
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace tallyd::platform {

/// What stands in for bytes that are no UTF-8: U+FFFD.
inline constexpr std::string_view kReplacementCharacter = "\xEF\xBF\xBD";

/// The first bytes of a text: one character, or a maximal part of one that is broken.
struct UTF8Sequence {
  std::size_t length = 0;  ///< Bytes; never 0.
  bool wellFormed = false;
};

/// The sequence at the start of `text`, which must not be empty.
inline UTF8Sequence firstUTF8Sequence(std::string_view text) {
  const auto byteAt = [text](std::size_t i) { return static_cast<std::uint8_t>(text[i]); };
  const std::uint8_t lead = byteAt(0);
  if (lead < 0x80) return {1, true};
  if (lead < 0xC2 || lead > 0xF4) return {1, false};
  const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  // The second byte's range shuts out overlong forms, surrogates and everything above U+10FFFF.
  std::uint8_t low = 0x80;
  std::uint8_t high = 0xBF;
  if (lead == 0xE0) low = 0xA0;
  if (lead == 0xED) high = 0x9F;
  if (lead == 0xF0) low = 0x90;
  if (lead == 0xF4) high = 0x8F;
  for (std::size_t i = 1; i < length; ++i) {
    if (i == text.size() || byteAt(i) < low || byteAt(i) > high) return {i, false};
    low = 0x80;
    high = 0xBF;
  }
  return {length, true};
}

/// Appends the character `codePoint`; the replacement character for a surrogate or a number above U+10FFFF.
inline void appendUTF8(std::string& text, std::uint32_t codePoint) {
  const auto append = [&text](std::uint32_t byte) { text += static_cast<char>(byte); };
  if (codePoint < 0x80) {
    append(codePoint);
  } else if (codePoint < 0x800) {
    append(0xC0 | codePoint >> 6);
    append(0x80 | (codePoint & 0x3F));
  } else if (codePoint > 0x10FFFF || (codePoint >= 0xD800 && codePoint < 0xE000)) {
    text += kReplacementCharacter;
  } else if (codePoint < 0x10000) {
    append(0xE0 | codePoint >> 12);
    append(0x80 | (codePoint >> 6 & 0x3F));
    append(0x80 | (codePoint & 0x3F));
  } else {
    append(0xF0 | codePoint >> 18);
    append(0x80 | (codePoint >> 12 & 0x3F));
    append(0x80 | (codePoint >> 6 & 0x3F));
    append(0x80 | (codePoint & 0x3F));
  }
}

/// How many bytes at the front are ASCII.
inline std::size_t asciiLength(std::string_view text) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  std::size_t length = 0;
  for (std::uint64_t word = 0; length + sizeof word <= text.size(); length += sizeof word) {
    std::memcpy(&word, text.data() + length, sizeof word);
    if ((word & kHighBits) != 0) break;
  }
  while (length < text.size() && static_cast<std::uint8_t>(text[length]) < 0x80) ++length;
  return length;
}

inline bool isUTF8(std::string_view text) {
  while (true) {
    text.remove_prefix(asciiLength(text));
    if (text.empty()) return true;
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    if (!sequence.wellFormed) return false;
    text.remove_prefix(sequence.length);
  }
}

/// `text` with every broken sequence replaced by U+FFFD.
inline std::string withBrokenUTF8Replaced(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (true) {
    const std::size_t plain = asciiLength(text);
    result += text.substr(0, plain);
    text.remove_prefix(plain);
    if (text.empty()) return result;
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    result += sequence.wellFormed ? text.substr(0, sequence.length) : kReplacementCharacter;
    text.remove_prefix(sequence.length);
  }
}

/// The first whole characters of `text`, which is UTF-8, in at most `maximumBytes`.
inline std::string_view wholeUTF8Characters(std::string_view text, std::size_t maximumBytes) {
  if (text.size() <= maximumBytes) return text;
  const auto isContinuation = [text](std::size_t i) {
    return (static_cast<std::uint8_t>(text[i]) & 0xC0) == 0x80;
  };
  std::size_t end = maximumBytes;
  while (end > 0 && isContinuation(end)) --end;
  return text.substr(0, end);
}

}  // namespace tallyd::platform
