#include "station/EventNumbers.h"

#include <fmt/format.h>

#include <algorithm>

namespace tallyd::station {

void EventNumbers::add(std::uint16_t number) {
  constexpr int kHalfRound = 32'768;
  if (_distinct > 0 && number + kHalfRound < _highest) beginRound();
  if (number >= _came.size()) _came.resize(std::size_t{number} + 1);
  if (_came[number]) {
    ++_repeated;
    return;
  }
  _came[number] = true;
  _lowest = _distinct == 0 ? number : std::min(_lowest, number);
  _highest = std::max(_highest, number);
  ++_distinct;
}

void EventNumbers::beginRound() {
  _earlierDistinct += _distinct;
  _earlierMissing += missingInRound();
  _came.clear();
  _lowest = _highest = 0;
  _distinct = 0;
}

std::uint64_t EventNumbers::missingInRound() const {
  return _distinct == 0 ? 0 : std::uint64_t{_highest} - _lowest + 1 - _distinct;
}

std::string EventNumbers::missingText(std::size_t most) const {
  std::string text;
  std::size_t gaps = 0;
  const auto end = _came.end();
  auto gap = std::find(_came.begin() + std::min<std::ptrdiff_t>(_lowest, std::ssize(_came)), end, false);
  while (gap != end) {
    if (gaps++ == most) return text + ", …";
    const auto gapEnd = std::find(gap, end, true);
    const auto first = gap - _came.begin();
    const auto last = gapEnd - _came.begin() - 1;
    if (!text.empty()) text += ", ";
    text += first == last ? fmt::format("{}", first) : fmt::format("{}–{}", first, last);
    gap = std::find(gapEnd, end, false);
  }
  return text;
}

}  // namespace tallyd::station
