#include "platform/ipc/StreamPosition.h"

namespace tallyd::platform {

std::optional<StreamPosition::Header> StreamPosition::header(std::string_view start) {
  if (start.size() < kHeaderSize || (start[0] != 'l' && start[0] != 'B')) return std::nullopt;
  const auto number = [&](std::size_t offset) {
    std::uint32_t value = 0;
    for (std::size_t i = 0; i < 4; ++i) {
      const std::size_t place = start[0] == 'B' ? i : 3 - i;
      value = value << 8 | static_cast<unsigned char>(start[offset + place]);
    }
    return value;
  };
  // Body length, serial and length of the header fields, which are filled up to a multiple of eight.
  const std::uint64_t fields = (std::uint64_t{number(12)} + 7) / 8 * 8;
  return Header{kHeaderSize + fields + number(4), number(8)};
}

void StreamPosition::authenticated(std::string_view readAhead) {
  auto next = header(readAhead);
  while (next && next->size <= readAhead.size()) {
    ++_readAhead;
    readAhead.remove_prefix(next->size);
    next = header(readAhead);
  }
  _withinAfterReadAhead = !readAhead.empty();
  if (next) _missingAfterReadAhead = next->size - readAhead.size();
  if (_readAhead == 0) {
    _within = _withinAfterReadAhead;
    _missing = _missingAfterReadAhead;
  }
}

bool StreamPosition::holdsWhole(std::string_view start) const {
  if (_within) return _missing && *_missing <= start.size();
  const auto next = header(start);
  return next && next->size <= start.size();
}

void StreamPosition::willRead(std::string_view start, std::size_t available) {
  _expected.clear();
  _seen = 0;
  _available = available;
  _next.reset();
  if (_within) return;
  auto next = header(start);
  while (next && next->size <= start.size()) {
    _expected.push_back(next->serial);
    start.remove_prefix(next->size);
    _available -= next->size;
    next = header(start);
  }
  if (next) _next = next->size;
}

StreamPosition::Verdict StreamPosition::delivered(std::uint64_t serial) {
  if (_readAhead > 0) {
    if (--_readAhead == 0) {
      _within = _withinAfterReadAhead;
      _missing = _missingAfterReadAhead;
    }
    return Verdict::Fine;
  }
  _within = false;
  _missing.reset();
  if (!nextIsKnown()) return Verdict::Fine;
  const bool isNext = _expected[_seen++] == serial;
  if (!isNext || !nextIsKnown())
    _expected = {};  // Many at a time are rare: an idle connection keeps no room for them.
  return isNext ? Verdict::Fine : Verdict::Malformed;
}

StreamPosition::Verdict StreamPosition::readWithoutDelivery() {
  if (_readAhead > 0 || nextIsKnown()) return Verdict::Malformed;
  if (!_within) {
    _within = true;
    _missing = _next;
  }
  if (_missing && *_missing <= _available) return Verdict::Malformed;
  if (_missing) *_missing -= _available;
  _available = 0;
  return Verdict::Fine;
}

}  // namespace tallyd::platform
