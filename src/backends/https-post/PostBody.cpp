#include "backends/https-post/PostBody.h"

#include <cmath>

#include "platform/JSON.h"

namespace tallyd {

using platform::Dictionary;
using platform::Value;

namespace {

bool isJSONScalar(const Value& value) {
  if (value.isString()) return true;
  return value.isNumber() && std::isfinite(value.realValue().value_or(0));
}

}  // namespace

void sanitizeEventForJSON(Dictionary& event, platform::Log& log) {
  const Dictionary before = event;
  for (const auto& [key, value] : before) {
    if (isJSONScalar(value)) continue;
    if (const auto date = value.date()) {
      event.set(key, fmt::format("{:.3f}", date->secondsSince1970));
      continue;
    }
    asl_log(log, platform::LogLevel::Warning,
            "Tally: NSJSONSerialization unable to handle key: {}, value: {}", key, value.description());
    event.remove(key);
  }
}

std::optional<std::string> postBody(const timeval& postTime, const std::optional<std::string>& clientId,
                                    std::vector<Dictionary> events) {
  Dictionary body{{"postTime", fmt::format("{}.{:3}", postTime.tv_sec, postTime.tv_usec / 1000)}};
  if (clientId) {
    body.set("clientId", *clientId);
    body.set("events", platform::Array(std::vector<Value>(std::make_move_iterator(events.begin()),
                                                          std::make_move_iterator(events.end()))));
  }
  return platform::jsonFromValue(body);
}

}  // namespace tallyd
