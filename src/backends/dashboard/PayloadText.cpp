#include "backends/dashboard/PayloadText.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "platform/text/UnicodeText.h"

namespace tallyd {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kNoDescription = "null";

/// The space and the equals sign.
constexpr std::size_t kShortestItemBytes = 2;

bool isDescribed(const Value& object) { return object.isString() || object.isNumber(); }

std::size_t descriptionLength(const Value& object) {
  if (const auto text = object.string()) return platform::utf16Length(*text);
  return isDescribed(object) ? object.description().size() : kNoDescription.size();
}

/// The entries that may find room in `bytes`, shortest first.
std::vector<const Dictionary::Entry*> shortestEntries(const Dictionary& payload, std::size_t bytes) {
  using Ranked = std::pair<std::size_t, const Dictionary::Entry*>;
  std::vector<Ranked> ranked;
  ranked.reserve(payload.size());
  for (const auto& entry : payload) ranked.emplace_back(descriptionLength(entry.value), &entry);
  const std::size_t count = std::min(ranked.size(), bytes / kShortestItemBytes + 1);
  std::partial_sort(ranked.begin(), ranked.begin() + static_cast<std::ptrdiff_t>(count), ranked.end());
  std::vector<const Dictionary::Entry*> shortest(count);
  std::transform(ranked.begin(), ranked.begin() + static_cast<std::ptrdiff_t>(count), shortest.begin(),
                 [](const Ranked& one) { return one.second; });
  return shortest;
}

std::string_view upToNUL(std::string_view text) { return text.substr(0, text.find('\0')); }

}  // namespace

std::size_t writePayloadText(const Dictionary& payload, std::span<char> area) {
  std::size_t length = 0;
  const auto append = [&](std::string_view text) {
    length += text.copy(area.data() + length, area.size() - length);
  };
  for (const auto* entry : shortestEntries(payload, area.size())) {
    if (length == area.size()) break;
    append(" ");
    append(upToNUL(entry->key));
    append("=");
    append(upToNUL(sanitize(descriptionForObject(entry->value))));
  }
  return length;
}

std::string descriptionForObject(const Value& object) {
  return isDescribed(object) ? object.description() : std::string(kNoDescription);
}

std::string sanitize(std::string_view text) {
  std::string sanitized;
  sanitized.reserve(text.size());
  const auto isSpecial = [](char c) { return c == '\n' || c == '\\' || c == '='; };
  for (auto next = text.begin(); next != text.end();) {
    const auto special = std::find_if(next, text.end(), isSpecial);
    sanitized.append(next, special);
    if (special == text.end()) break;
    if (*special == '\\' || *special == '=') sanitized += '\\';
    if (*special != '\n') sanitized += *special;
    next = special + 1;
  }
  return sanitized.empty() ? "empty" : sanitized;
}

}  // namespace tallyd
