#include "station/TerminalView.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <ctime>

#include "platform/JSON.h"

namespace tallyd::station {

namespace {

using platform::Dictionary;
using platform::Value;

bool isPlain(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
         std::string_view("._:/+-@%").find(c) != std::string_view::npos;
}

std::string readableText(std::string_view text) {
  if (!text.empty() && std::all_of(text.begin(), text.end(), isPlain)) return std::string(text);
  return platform::jsonFromValue(Value(text)).value_or("\"\"");
}

std::string readableValue(const Value* value) {
  if (value == nullptr) return "-";
  if (const auto text = value->string()) return readableText(*text);
  return readableText(platform::jsonFromValue(*value).value_or(value->description()));
}

/// "2026-03-01 12:00:01.250" of seconds since 1970; the value as it is when it is no such time.
std::string readableTime(const Value* value) {
  constexpr double kYear9999 = 253402300799.0;
  const double seconds = value == nullptr ? 0 : value->realValue().value_or(0);
  if (!(seconds > 0 && seconds < kYear9999)) return readableValue(value);
  const auto milliseconds = std::llround(seconds * 1000);
  return fmt::format("{:%Y-%m-%d %H:%M:%S}.{:03}", fmt::gmtime(static_cast<std::time_t>(milliseconds / 1000)),
                     milliseconds % 1000);
}

/// Fields that the reporting side adds itself; all others are the event's payload.
bool isPayload(std::string_view key) { return !key.starts_with('_') && key != "eventTime"; }

}  // namespace

std::string readableEvent(const Dictionary& event) {
  std::string line =
      fmt::format("{}  {}  session {}  method {}  status {}  #{}", readableTime(event.find("eventTime")),
                  readableValue(event.find("_sender")), readableValue(event.find("_sessionID")),
                  readableValue(event.find("_method")), readableValue(event.find("_status")),
                  readableValue(event.find("_eventNumber")));
  std::string_view separator = "  ";
  for (const auto& [key, value] : event) {
    if (!isPayload(key)) continue;
    line += fmt::format("{}{}={}", separator, readableText(key), readableValue(&value));
    separator = " ";
  }
  return line;
}

void TerminalView::showEvent(const Dictionary& event, std::string_view record) {
  if (_events == Events::JSON) writeLine(_output, record);
  if (_events == Events::Readable) writeLine(_output, readableEvent(event));
}

void TerminalView::showNotice(std::string_view line) {
  writeLine(_events == Events::JSON ? _problems : _output, line);
}

void TerminalView::showProblem(std::string_view line) {
  writeLine(_problems, fmt::format("tally-station: {}", line));
}

void TerminalView::writeLine(std::ostream& stream, std::string_view line) {
  std::string shown(line);
  std::replace_if(
      shown.begin(), shown.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; }, '?');
  const std::lock_guard lock(_mutex);
  stream << shown << '\n' << std::flush;
}

}  // namespace tallyd::station
