#include "platform/dbus/ByteReader.h"

#include "platform/UTF8.h"

namespace tallyd::platform::dbus {

namespace {

/// How many bytes at the front are ASCII without a NUL; looks at eight at a time and may stop early.
std::size_t plainPrefix(std::string_view text) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  constexpr std::uint64_t kOnes = 0x0101010101010101;
  std::size_t length = 0;
  while (text.size() - length >= sizeof(std::uint64_t)) {
    std::uint64_t word;
    std::memcpy(&word, text.data() + length, sizeof word);
    // The subtraction borrows into the high bit of a byte that is zero.
    if (((word | (word - kOnes)) & kHighBits) != 0) break;
    length += sizeof word;
  }
  while (length < text.size() && text[length] > 0) ++length;
  return length;
}

}  // namespace

void throwMalformed(const char* reason) { throw Malformed{reason}; }

bool ByteReader::isCarriableText(std::string_view text) {
  text.remove_prefix(plainPrefix(text));
  while (!text.empty()) {
    if (text[0] == '\0') return false;
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    if (!sequence.wellFormed) return false;
    text.remove_prefix(sequence.length);
  }
  return true;
}

}  // namespace tallyd::platform::dbus
