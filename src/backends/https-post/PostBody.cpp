#include "backends/https-post/PostBody.h"

#include <cmath>

namespace tallyd {

using platform::JSONText;
using platform::Value;

namespace {

bool isJSONScalar(const EventField& field) {
  if (!field.value || field.value->isString()) return true;
  return field.value->isNumber() && std::isfinite(field.value->realValue().value_or(0));
}

}  // namespace

void sanitizeEventForJSON(EventFields& event, platform::Log& log) {
  event.change([&](EventField& field) {
    if (isJSONScalar(field)) return true;
    if (const auto date = field.value->date()) {
      event.setText(field, fmt::format("{:.3f}", date->secondsSince1970));
      return true;
    }
    asl_log(log, platform::LogLevel::Warning,
            "Tally: NSJSONSerialization unable to handle key: {}, value: {}", field.key, field.description());
    return false;
  });
}

void appendEvent(JSONText& json, const EventFields& event) {
  json.startObject();
  for (const EventField& field : event) {
    if (!field.json.empty()) {
      json.written(field.json);
      continue;
    }
    json.key(field.key);
    if (field.value) {
      (void)json.value(*field.value);
    } else {
      json.text(field.text);
    }
  }
  json.endObject();
}

std::string postBody(const timeval& postTime, const std::optional<std::string>& clientId,
                     std::string_view events) {
  constexpr std::size_t kAroundTheEvents = 128;
  JSONText body(events.size() + kAroundTheEvents);
  body.startObject();
  if (clientId) {
    body.key("clientId");
    body.text(*clientId);
    body.key("events");
    body.written(events);
  }
  body.key("postTime");
  body.text(fmt::format("{}.{:3}", postTime.tv_sec, postTime.tv_usec / 1000));
  body.endObject();
  return body.string();
}

}  // namespace tallyd
