#include "Events.h"

#include <fmt/format.h>

#include <charconv>
#include <cstdint>
#include <stdexcept>

#include "Storebags.h"

namespace tallyd::bench {

using platform::Dictionary;

namespace {

constexpr std::size_t kDigits = 8;
constexpr std::array<std::string_view, 16> kWords{
    "evening", "concert", "chamber", "journey", "lantern", "harvest", "morning", "granite",
    "distant", "meadows", "sixteen", "whisper", "orchard", "station", "thunder", "village"};

/// A number that looks like chance: the finaliser of splitmix64.
std::uint64_t scattered(std::uint64_t number) {
  number += 0x9e3779b97f4a7c15;
  number = (number ^ number >> 30) * 0xbf58476d1ce4e5b9;
  number = (number ^ number >> 27) * 0x94d049bb133111eb;
  return number ^ number >> 31;
}

/// Values of the hashed field that are as long as a hash is: the value itself is half as long.
std::size_t hashesIn(std::string_view document) {
  constexpr std::size_t kHashDigits = 64;
  const std::string key = fmt::format(R"("{}":")", kHashedField);
  std::size_t count = 0;
  for (auto at = document.find(key); at != std::string_view::npos; at = document.find(key, at + 1)) {
    const std::size_t start = at + key.size();
    if (document.find('"', start) - start == kHashDigits) ++count;
  }
  return count;
}

}  // namespace

VariableTexts variableTexts(std::size_t number) {
  const std::uint64_t first = scattered(2 * number);
  const std::uint64_t second = scattered(2 * number + 1);
  const auto word = [&](int place) { return kWords[first >> (4 * place) & 15]; };
  return {
      .running = fmt::format("#{:08}", number),
      .request = fmt::format("{:016x}{:016x}", first, second),
      .title = fmt::format("{} {} {} {} {}", word(0), word(1), word(2), word(3), word(4)),
      .referrer = fmt::format("tally-client://home/shelf/{:02}/item/{:06}", second % 100, second % 999'983)};
}

Dictionary payload(std::size_t number) {
  const VariableTexts texts = variableTexts(number);
  return {{"running", texts.running},
          {kHashedField, texts.request},
          {"title", texts.title},
          {"container", "library.playlist.recently-added"},
          {"referrer", texts.referrer},
          {"networkType", "wifi"},
          {"durationMs", 215'034},
          {"bufferedRatio", 0.8125},
          {"position", 17},
          {"cached", true}};
}

EventCheck::EventCheck(std::size_t events, std::size_t copies) : _copies(copies), _seen(events) {}

void EventCheck::addDocument(std::string_view document) {
  constexpr std::string_view kKey = R"("running":"#)";
  const std::size_t before = _count;
  for (auto at = document.find(kKey); at != std::string_view::npos;
       at = document.find(kKey, at + kKey.size()))
    add(document.data() + at + kKey.size());
  if (hashesIn(document) != _count - before) {
    throw std::runtime_error(fmt::format("\"{}\" has left unhashed", kHashedField));
  }
}

void EventCheck::addDatagram(std::string_view datagram) {
  constexpr std::string_view kKey = " running=#";
  const auto at = datagram.find(kKey);
  if (at != std::string_view::npos) add(datagram.data() + at + kKey.size());
}

void EventCheck::finish() const {
  const std::size_t expected = _seen.size() * _copies;
  if (_count != expected)
    throw std::runtime_error(fmt::format("{} of {} events were lost", expected - _count, expected));
}

void EventCheck::add(const char* digits) {
  std::size_t number = _seen.size();
  std::from_chars(digits, digits + kDigits, number);
  if (number >= _seen.size()) throw std::runtime_error("an event has come that nobody sent");
  if (++_seen[number] > _copies) throw std::runtime_error(fmt::format("event {} has come too often", number));
  ++_count;
}

}  // namespace tallyd::bench
