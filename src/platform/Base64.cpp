#include "platform/Base64.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <limits>

namespace tallyd::platform {

namespace {

constexpr std::uint8_t kPadding = 64;
constexpr std::uint8_t kUnknown = 65;

constexpr std::array<std::uint8_t, 256> decodingTable() {
  constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::array<std::uint8_t, 256> table{};
  table.fill(kUnknown);
  std::uint8_t value = 0;
  for (const char letter : kAlphabet) table[static_cast<unsigned char>(letter)] = value++;
  table[static_cast<unsigned char>('=')] = kPadding;
  return table;
}

}  // namespace

std::string base64Encoded(std::string_view bytes) {
  // A multiple of three, so that only the last block is padded; the library counts in int.
  constexpr std::size_t kBlock = 3 << 20;
  std::string text((bytes.size() + 2) / 3 * 4 + 1, '\0');  // One more for the NUL that the library adds.
  auto* out = reinterpret_cast<unsigned char*>(text.data());
  for (; !bytes.empty(); bytes.remove_prefix(std::min(kBlock, bytes.size()))) {
    const std::string_view block = bytes.substr(0, kBlock);
    out += EVP_EncodeBlock(out, reinterpret_cast<const unsigned char*>(block.data()),
                           static_cast<int>(block.size()));
  }
  text.pop_back();
  return text;
}

std::optional<std::string> base64DecodedIgnoringUnknown(std::string_view text) {
  static constexpr auto kTable = decodingTable();
  std::string bytes;
  bytes.reserve(text.size() / 4 * 3);
  std::uint32_t group = 0;
  int characters = 0;  // In the current group, padding included.
  int padding = 0;
  for (const char letter : text) {
    const std::uint8_t value = kTable[static_cast<unsigned char>(letter)];
    if (value == kUnknown) continue;
    if (value == kPadding ? characters < 2 : padding > 0) return std::nullopt;
    padding += value == kPadding ? 1 : 0;
    group = group << 6 | (value & 63U);
    if (++characters < 4) continue;
    for (int i = 0; i < 3 - padding; ++i) bytes += static_cast<char>(group >> (16 - 8 * i) & 0xFF);
    characters = 0;
    group = 0;
  }
  if (characters != 0) return std::nullopt;
  return bytes;
}

}  // namespace tallyd::platform
