#include "Events.h"

#include <fmt/format.h>

#include <charconv>
#include <cstdint>
#include <stdexcept>

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
          {"requestID", texts.request},
          {"title", texts.title},
          {"container", "library.playlist.recently-added"},
          {"referrer", texts.referrer},
          {"networkType", "wifi"},
          {"durationMs", 215'034},
          {"bufferedRatio", 0.8125},
          {"position", 17},
          {"cached", true}};
}

void checkEvents(const std::vector<std::string>& documents, std::size_t events) {
  constexpr std::string_view kKey = "\"running\":\"#";
  std::vector<bool> seen(events);
  std::size_t count = 0;
  for (const std::string& document : documents) {
    for (auto at = document.find(kKey); at != std::string::npos; at = document.find(kKey, at + kKey.size())) {
      std::size_t number = events;
      const char* digits = document.data() + at + kKey.size();
      std::from_chars(digits, digits + kDigits, number);
      if (number >= events) throw std::runtime_error("the collector received an event that nobody sent");
      if (seen[number]) throw std::runtime_error(fmt::format("event {} was received twice", number));
      seen[number] = true;
      ++count;
    }
  }
  if (count != events)
    throw std::runtime_error(fmt::format("{} of {} events were lost", events - count, events));
}

}  // namespace tallyd::bench
