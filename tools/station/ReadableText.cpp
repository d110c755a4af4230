#include "station/ReadableText.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <ctime>

#include "platform/Base64.h"
#include "platform/JSON.h"

namespace tallyd::station {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::Value;

namespace {

bool isPlain(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
         std::string_view("._:/+-@%").find(c) != std::string_view::npos;
}

/// JSON with escapes also for DEL and for the controls of ISO/IEC 6429 (U+0080 to U+009F), which it leaves as
/// they are.
std::string withoutControls(std::string_view json) {
  std::string quiet;
  for (std::size_t i = 0; i < json.size(); ++i) {
    const auto byteAt = [&](std::size_t at) { return static_cast<unsigned char>(json[at]); };
    if (byteAt(i) == 0x7F) {
      quiet += "\\u007f";
    } else if (byteAt(i) == 0xC2 && i + 1 < json.size() && byteAt(i + 1) < 0xA0) {
      quiet += fmt::format("\\u{:04x}", byteAt(++i));
    } else {
      quiet += json[i];
    }
  }
  return quiet;
}

/// Fields that the reporting side adds itself; all others are the event's payload.
bool isPayload(std::string_view key) { return !key.starts_with('_') && key != "eventTime"; }

struct JSONForm {
  Value operator()(double value) const {
    return std::isfinite(value) ? Value(value) : Value(Value(value).description());
  }
  Value operator()(Date value) const {
    const Value seconds(value.secondsSince1970);
    return Dictionary{{"date", readableTime(&seconds)}};
  }
  Value operator()(const Data& value) const {
    return Dictionary{{"data", platform::base64Encoded(value.bytes())}};
  }
  Value operator()(const Array& value) const {
    Array form;
    for (const Value& element : value) form.append(jsonForm(element));
    return form;
  }
  Value operator()(const Dictionary& value) const {
    std::vector<Dictionary::Entry> form;
    for (const auto& [key, element] : value) form.push_back({key, jsonForm(element)});
    return Dictionary(std::move(form));
  }
  Value operator()(std::monostate) const { return {}; }
  template <class Scalar>
  Value operator()(const Scalar& value) const {
    return Value(value);
  }
};

}  // namespace

std::string readableText(std::string_view text) {
  if (!text.empty() && std::all_of(text.begin(), text.end(), isPlain)) return std::string(text);
  return withoutControls(platform::jsonFromValue(Value(text)).value_or("\"\""));
}

std::string readableValue(const Value* value) {
  if (value == nullptr) return "-";
  if (const auto text = value->string()) return readableText(*text);
  return readableText(platform::jsonFromValue(jsonForm(*value)).value_or(value->description()));
}

std::string readableTime(const Value* value) {
  constexpr double kYear9999 = 253402300799.0;
  const double seconds = value == nullptr ? 0 : value->realValue().value_or(0);
  if (!(seconds > 0 && seconds < kYear9999)) return readableValue(value);
  const auto milliseconds = std::llround(seconds * 1000);
  return fmt::format("{:%Y-%m-%d %H:%M:%S}.{:03}", fmt::gmtime(static_cast<std::time_t>(milliseconds / 1000)),
                     milliseconds % 1000);
}

std::string readableFields(const Dictionary& fields) {
  std::string text;
  for (const auto& [key, value] : fields)
    text += fmt::format(" {}={}", readableText(key), readableValue(&value));
  return text;
}

std::string readableEvent(const Dictionary& event) {
  Dictionary payload;
  for (const auto& [key, value] : event) {
    if (isPayload(key)) payload.set(key, value);
  }
  return fmt::format("{}  {}  session {}  method {}  status {}  #{}{}{}",
                     readableTime(event.find("eventTime")), readableValue(event.find("_sender")),
                     readableValue(event.find("_sessionID")), readableValue(event.find("_method")),
                     readableValue(event.find("_status")), readableValue(event.find("_eventNumber")),
                     payload.empty() ? "" : " ", readableFields(payload));
}

std::string shortened(std::string_view text, std::size_t bytes) {
  constexpr unsigned kContinuationMask = 0xC0;
  constexpr unsigned kContinuation = 0x80;
  if (text.size() <= bytes) return std::string(text);
  while (bytes > 0 && (static_cast<unsigned char>(text[bytes]) & kContinuationMask) == kContinuation) --bytes;
  return std::string(text.substr(0, bytes)) + "…";
}

Value jsonForm(const Value& value) { return value.visit(JSONForm()); }

std::string recordOf(const Dictionary& record) { return platform::jsonFromValue(jsonForm(record)).value(); }

}  // namespace tallyd::station
