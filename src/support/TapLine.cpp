#include "support/TapLine.h"

#include <fmt/format.h>

#include "platform/JSON.h"

namespace tallyd {

using platform::Value;

namespace {

std::string jsonOf(const Value& value) {
  if (auto json = platform::jsonFromValue(value)) return std::move(*json);
  return platform::jsonFromValue(Value(value.description())).value_or("null");
}

}  // namespace

TapLine::TapLine(std::string_view kind, platform::TimePoint time)
    : _text(fmt::format("{{\"time\":{:.3f}", platform::secondsSince1970(time))) {
  add("kind", kind);
}

TapLine& TapLine::add(std::string_view key, const Value& value) { return addJSON(key, jsonOf(value)); }

TapLine& TapLine::addJSON(std::string_view key, std::string_view json) {
  _text += ',';
  _text += jsonOf(Value(key));
  _text += ':';
  _text += json;
  return *this;
}

std::string TapLine::finished() && {
  _text += "}\n";
  return std::move(_text);
}

}  // namespace tallyd
