#include "tallyctl/TapText.h"

#include <fmt/format.h>

#include <cmath>
#include <ctime>

#include "platform/JSON.h"
#include "tallyctl/PlainText.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::int64_t numberOf(const Dictionary& event, std::string_view key) {
  return event.integer(key).value_or(0);
}

std::string textOf(const Dictionary& event, std::string_view key) {
  return plainText(event.string(key).value_or(""));
}

std::string timeOf(const Dictionary& event) {
  const double time = event.real("time").value_or(0);
  const auto seconds = static_cast<std::time_t>(std::floor(time));
  std::tm local{};
  ::localtime_r(&seconds, &local);
  return fmt::format("{:02}:{:02}:{:02}.{:03}", local.tm_hour, local.tm_min, local.tm_sec,
                     static_cast<int>((time - std::floor(time)) * 1'000));
}

std::string ownerOf(const Dictionary& event) {
  if (!event.contains("session")) return "";
  const std::string backend = textOf(event, "backend");
  return fmt::format(" [{}{}]", numberOf(event, "session"), backend.empty() ? "" : " " + backend);
}

/// ": status 200", or what went wrong; nothing as long as there is no result.
std::string resultOf(const Dictionary& event) {
  const Dictionary* result = event.dictionary("result");
  if (!result) return "";
  if (result->contains("error")) return fmt::format(": failed, {}", textOf(*result, "error"));
  return fmt::format(": status {}", numberOf(*result, "status"));
}

std::string messageOf(const Dictionary& event) {
  if (!event.contains("method")) return "";
  return fmt::format(", method {}, event {}", numberOf(event, "method"), numberOf(event, "event"));
}

std::string descriptionOf(const Dictionary& event, std::string_view key) {
  const Value* value = event.find(key);
  return value ? plainText(platform::jsonFromValue(*value).value_or("")) : "";
}

std::string postText(const Dictionary& event) {
  if (event.contains("result")) return fmt::format("post {}{}", numberOf(event, "post"), resultOf(event));
  return fmt::format("post {} to {}: {} events, {} bytes ({}) {}", numberOf(event, "post"),
                     textOf(event, "url"), numberOf(event, "events"), numberOf(event, "bytes"),
                     textOf(event, "encoding"), descriptionOf(event, "document"));
}

std::string datagramText(const Dictionary& event) {
  return fmt::format("datagram to {}{}, {} bytes: {}", textOf(event, "server"), messageOf(event),
                     event.string("bytes").value_or("").size() / 2, textOf(event, "text"));
}

std::string adaptorText(const Dictionary& event) {
  return fmt::format("adaptor{} {}", messageOf(event), descriptionOf(event, "payload"));
}

/// Nothing for a kind that is unknown.
std::string eventText(const Dictionary& event) {
  const std::string kind = textOf(event, "kind");
  if (kind == "post") return postText(event);
  if (kind == "datagram") return datagramText(event);
  if (kind == "power") return fmt::format("power log {}", descriptionOf(event, "record"));
  if (kind == "adaptor") return adaptorText(event);
  if (kind == "upload") {
    return fmt::format("upload {} to {}, {} bytes{}", textOf(event, "file"), textOf(event, "url"),
                       numberOf(event, "bytes"), resultOf(event));
  }
  if (kind == "log-data") {
    return fmt::format("log data to {}, {} bytes{}", textOf(event, "url"), numberOf(event, "bytes"),
                       resultOf(event));
  }
  if (kind == "drop") {
    return fmt::format("dropped {} ({}){}", numberOf(event, "count"), textOf(event, "reason"),
                       messageOf(event));
  }
  if (kind == "missed") return fmt::format("missed {} lines", numberOf(event, "count"));
  return "";
}

}  // namespace

std::string tapText(std::string_view line) {
  const auto parsed = platform::valueFromJSON(line);
  const Dictionary* event = parsed.value ? parsed.value->dictionary() : nullptr;
  if (!event) return plainText(line);
  const std::string text = eventText(*event);
  return timeOf(*event) + ownerOf(*event) + " " + (text.empty() ? plainText(line) : text);
}

}  // namespace tallyd::tallyctl
