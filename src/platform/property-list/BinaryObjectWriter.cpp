#include "platform/property-list/BinaryObjectWriter.h"

#include <algorithm>
#include <bit>
#include <type_traits>

#include "platform/UTF8.h"

namespace tallyd::platform {

namespace {

// An object's first byte: its kind, and in the low half its size or the power of two of that.
constexpr std::uint8_t kFalse = 0x08;
constexpr std::uint8_t kTrue = 0x09;
constexpr std::uint8_t kInteger64 = 0x13;  // Eight bytes are signed, sixteen hold what is larger.
constexpr std::uint8_t kInteger128 = 0x14;
constexpr std::uint8_t kReal64 = 0x23;
constexpr std::uint8_t kData = 0x40;
constexpr std::uint8_t kASCIIString = 0x50;
constexpr std::uint8_t kUTF16String = 0x60;
constexpr std::uint8_t kUID32 = 0x83;
constexpr std::uint8_t kArray = 0xA0;
constexpr std::uint8_t kDictionary = 0xD0;
constexpr std::uint8_t kCountFollows = 0x0F;

bool isASCII(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

/// The character of a well-formed sequence.
std::uint32_t codePoint(std::string_view sequence) {
  const auto lead = static_cast<std::uint8_t>(sequence[0]);
  if (sequence.size() == 1) return lead;
  std::uint32_t character = lead & (0xFFU >> (sequence.size() + 1));
  for (const char byte : sequence.substr(1))
    character = character << 6U | (static_cast<std::uint8_t>(byte) & 0x3FU);
  return character;
}

std::u16string utf16(std::string_view text) {
  constexpr std::uint32_t kFirstSupplementary = 0x10000;
  std::u16string units;
  while (!text.empty()) {
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    const std::uint32_t character =
        codePoint(sequence.wellFormed ? text.substr(0, sequence.length) : kReplacementCharacter);
    text.remove_prefix(sequence.length);
    if (character < kFirstSupplementary) {
      units += static_cast<char16_t>(character);
    } else {
      units += static_cast<char16_t>(0xD800U + ((character - kFirstSupplementary) >> 10U));
      units += static_cast<char16_t>(0xDC00U + ((character - kFirstSupplementary) & 0x3FFU));
    }
  }
  return units;
}

}  // namespace

BinaryObjectWriter::BinaryObjectWriter() : _bytes("bplist00") {}

BinaryObjectWriter::Ref BinaryObjectWriter::reserve() {
  _offsets.push_back(0);
  return static_cast<Ref>(_offsets.size() - 1);
}

void BinaryObjectWriter::putBoolean(Ref at, bool value) {
  begin(at);
  append(value ? kTrue : kFalse);
}

void BinaryObjectWriter::putInteger(Ref at, std::int64_t value) {
  begin(at);
  append(kInteger64);
  append(static_cast<std::uint64_t>(value));
}

void BinaryObjectWriter::putInteger(Ref at, std::uint64_t value) {
  begin(at);
  append(kInteger128);
  append(std::uint64_t{0});
  append(value);
}

void BinaryObjectWriter::putReal(Ref at, double value) {
  begin(at);
  append(kReal64);
  append(std::bit_cast<std::uint64_t>(value));
}

void BinaryObjectWriter::putString(Ref at, std::string_view text) {
  begin(at);
  if (isASCII(text)) {
    appendCounted(kASCIIString, text.size());
    _bytes += text;
    return;
  }
  const std::u16string units = utf16(text);
  appendCounted(kUTF16String, units.size());
  for (const char16_t unit : units) append(static_cast<std::uint16_t>(unit));
}

void BinaryObjectWriter::putData(Ref at, std::string_view bytes) {
  begin(at);
  appendCounted(kData, bytes.size());
  _bytes += bytes;
}

void BinaryObjectWriter::putUID(Ref at, std::uint32_t number) {
  begin(at);
  append(kUID32);
  append(number);
}

void BinaryObjectWriter::putArray(Ref at, const std::vector<Ref>& elements) {
  begin(at);
  appendCounted(kArray, elements.size());
  for (const Ref element : elements) append(element);
}

void BinaryObjectWriter::putDictionary(Ref at, const std::vector<std::pair<Ref, Ref>>& entries) {
  begin(at);
  appendCounted(kDictionary, entries.size());
  for (const auto& entry : entries) append(entry.first);
  for (const auto& entry : entries) append(entry.second);
}

std::string BinaryObjectWriter::finish(Ref top) {
  const std::uint64_t tableOffset = _bytes.size();
  for (const std::uint32_t offset : _offsets) append(offset);
  constexpr std::size_t kUnusedBytes = 6;
  _bytes.append(kUnusedBytes, '\0');
  append(static_cast<std::uint8_t>(sizeof(_offsets[0])));
  append(static_cast<std::uint8_t>(sizeof(Ref)));
  append(std::uint64_t{_offsets.size()});
  append(std::uint64_t{top});
  append(tableOffset);
  _offsets.clear();
  return std::move(_bytes);
}

void BinaryObjectWriter::begin(Ref at) { _offsets[at] = static_cast<std::uint32_t>(_bytes.size()); }

void BinaryObjectWriter::appendCounted(std::uint8_t kind, std::size_t count) {
  if (count < kCountFollows) {
    append(static_cast<std::uint8_t>(kind | count));
    return;
  }
  append(static_cast<std::uint8_t>(kind | kCountFollows));
  append(kInteger64);
  append(std::uint64_t{count});
}

template <class Number>
void BinaryObjectWriter::append(Number number) {
  static_assert(std::is_unsigned_v<Number>);
  for (std::size_t i = sizeof number; i-- > 0;) {
    _bytes += static_cast<char>(std::uint64_t{number} >> (8 * i));
  }
}

}  // namespace tallyd::platform
