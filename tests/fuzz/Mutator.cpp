#include "Mutator.h"

#include <algorithm>
#include <array>

namespace tallyd::fuzz {

namespace {

int digitValue(char digit) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  const auto place = kDigits.find(digit >= 'A' && digit <= 'F' ? static_cast<char>(digit + 32) : digit);
  return place == std::string_view::npos ? 0 : static_cast<int>(place);
}

std::string unescaped(std::string_view text) {
  std::string plain;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\\' || i + 1 == text.size()) {
      plain += text[i];
    } else if (text[i + 1] == 'x' && i + 3 < text.size()) {
      plain += static_cast<char>(digitValue(text[i + 2]) * 16 + digitValue(text[i + 3]));
      i += 3;
    } else {
      plain += text[++i];
    }
  }
  return plain;
}

}  // namespace

std::vector<std::string> dictionaryFrom(std::string_view text) {
  std::vector<std::string> words;
  while (!text.empty()) {
    const auto line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    const auto start = line.find('"');
    const auto end = line.rfind('"');
    if (line.starts_with('#') || start == end) continue;
    words.push_back(unescaped(line.substr(start + 1, end - start - 1)));
  }
  return words;
}

std::string Mutator::next() {
  std::string input = _corpus[below(_corpus.size())];
  for (std::size_t changes = 1 + below(4); changes > 0; --changes) change(input);
  if (input.size() > kMaximumBytes) input.resize(kMaximumBytes);
  return input;
}

/// Up to 64 bytes from anywhere in it.
std::string_view Mutator::pieceOf(std::string_view text) {
  if (text.empty()) return text;
  return text.substr(below(text.size()), 1 + below(64));
}

void Mutator::change(std::string& input) {
  constexpr std::array<unsigned char, 12> kEdges{0, 1, 2, 4, 8, 16, 32, 64, 127, 128, 254, 255};
  const std::size_t kind = below(8);
  if (input.empty() || kind == 0) return insert(input, std::string(1, static_cast<char>(below(256))));
  const std::size_t at = below(input.size());
  switch (kind) {
    case 1:
      input[at] = static_cast<char>(static_cast<unsigned char>(input[at]) ^ 1U << below(8));
      return;
    case 2:
      input[at] = static_cast<char>(kEdges[below(kEdges.size())]);
      return;
    case 3:
      input.erase(at, 1 + below(16));
      return;
    case 4:
      return insert(input, std::string(pieceOf(input)));
    case 5:
      return insert(input, pieceOf(_corpus[below(_corpus.size())]));
    case 6:
      input.resize(at);
      return;
    default:
      if (!_words.empty()) insert(input, _words[below(_words.size())]);
  }
}

}  // namespace tallyd::fuzz
