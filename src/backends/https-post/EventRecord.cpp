#include "backends/https-post/EventRecord.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <tuple>
#include <vector>

#include "platform/JSON.h"

namespace tallyd {

using platform::Dictionary;

/// What the records of a session have in common, in the order of the keys.
struct EventRecord::Common {
  /// Where a field's value comes from.
  enum class Source { Session, Nowhere, SessionID, ClientTime, EventNumber, Method, Status, TimezoneOffset };

  struct Field {
    std::string_view key;
    Source source;
    std::string text{};  ///< Of the session's own fields; `json` is key and text as JSON.
    std::string json{};
  };

  std::vector<Field> fields;
};

namespace {

/// The facts that seldom change within a session, but for its identifier.
auto commonFacts(const EventFacts& facts) {
  return std::tie(facts.sessionStart, facts.sender, facts.clientVersion, facts.productFamily,
                  facts.productModel, facts.osVersion, facts.build, facts.isInternal,
                  facts.reportVersionMajor, facts.reportVersionMinor);
}

std::string decimal(std::int64_t number) { return fmt::format_int(number).str(); }

/// As "%.3f" has it.
std::string withMilliseconds(double seconds) {
  constexpr double kLeast =
      1024;  // From here on fractions have at most 42 bits: a thousand times one is exact.
  constexpr double kMost = 1e12;  // Below this the milliseconds fit their type.
  if (!(seconds >= kLeast && seconds < kMost)) return fmt::format("{:.3f}", seconds);
  const double whole = std::floor(seconds);
  auto milliseconds = static_cast<std::int64_t>(std::nearbyint((seconds - whole) * 1000));
  milliseconds += static_cast<std::int64_t>(whole) * 1000;
  std::string text = decimal(milliseconds);
  text.insert(text.size() - 3, 1, '.');
  return text;
}

std::string jsonMember(std::string_view key, std::string_view text) {
  platform::JSONText json;
  json.key(key);
  json.text(text);
  return json.string();
}

}  // namespace

std::int64_t truncateToMinute(std::int64_t seconds) {
  constexpr std::int64_t kMinute = 60;
  return seconds / kMinute * kMinute;
}

void EventRecord::fieldsInto(EventFields& fields) const {
  using Source = Common::Source;
  fields.clear();
  const std::string_view clientTime = fields.keep(withMilliseconds(_clientTime));
  const auto ownField = [&](const Common::Field& field) -> EventField {
    switch (field.source) {
      case Source::SessionID:
        return {.key = field.key, .value = &_sessionID};
      case Source::ClientTime:
        return {.key = field.key, .text = clientTime};
      case Source::EventNumber:
        return {.key = field.key, .text = fields.keep(decimal(_eventNumber))};
      case Source::Method:
        return {.key = field.key, .text = fields.keep(decimal(_method))};
      case Source::Status:
        return {.key = field.key, .text = fields.keep(decimal(_status))};
      case Source::TimezoneOffset:
        return {.key = field.key, .value = &_timezoneOffset};
      default:
        return {.key = field.key, .text = field.text, .json = field.json};
    }
  };
  const Dictionary::Entry* next = _payload.begin();
  for (const Common::Field& field : _common->fields) {
    while (next != _payload.end() && next->key < field.key) {
      fields.append({.key = next->key, .value = &next->value});
      ++next;
    }
    if (next != _payload.end() && next->key == field.key) ++next;
    if (field.source != Source::Nowhere) fields.append(ownField(field));
  }
  for (; next != _payload.end(); ++next) fields.append({.key = next->key, .value = &next->value});
}

EventRecord EventRecords::record(const std::optional<Dictionary>& payload, const EventFacts& facts) {
  if (!_prepared || commonFacts(*_prepared) != commonFacts(facts)) prepare(facts);
  if (_sessionID.string() != facts.sessionID) _sessionID = facts.sessionID;
  EventRecord record;
  if (payload) record._payload = *payload;
  record._common = _common;
  record._sessionID = _sessionID;
  record._timezoneOffset = static_cast<std::int64_t>(facts.timezoneOffset.count());
  record._clientTime = _startMinute + (facts.eventTime - facts.sessionStart);
  record._eventNumber = facts.eventNumber;
  record._method = facts.method;
  record._status = facts.status;
  return record;
}

void EventRecords::prepare(const EventFacts& facts) {
  using Source = EventRecord::Common::Source;
  const std::int64_t startMinute = truncateToMinute(static_cast<std::int64_t>(facts.sessionStart));
  _startMinute = static_cast<double>(startMinute);
  const auto common = std::make_shared<EventRecord::Common>();
  common->fields = {{"_clientTS", Source::ClientTime}, {"_eventNumber", Source::EventNumber},
                    {"_method", Source::Method},       {"_sessionID", Source::SessionID},
                    {"_status", Source::Status},       {"_timezoneOffset", Source::TimezoneOffset},
                    {"eventTime", Source::ClientTime}};
  const auto add = [&](std::string_view key, const std::optional<std::string_view>& text) {
    if (text) {
      common->fields.push_back({key, Source::Session, std::string(*text), jsonMember(key, *text)});
    } else {
      common->fields.push_back({key, Source::Nowhere});
    }
  };
  add("_clientVersion", decimal(facts.clientVersion));
  add("_internal", facts.isInternal ? "1" : "0");
  add("_reportVers", fmt::format("{}.{}", facts.reportVersionMajor, facts.reportVersionMinor));
  add("_sender", facts.sender);
  add("_startTS", decimal(startMinute));
  add("_productFamily", facts.productFamily);
  add("_productModel", facts.productModel);
  add("_osVersion", facts.osVersion);
  add("_build", facts.build);
  std::sort(common->fields.begin(), common->fields.end(),
            [](const auto& a, const auto& b) { return a.key < b.key; });
  _common = common;
  remember(facts);
}

/// With texts of our own.
void EventRecords::remember(const EventFacts& facts) {
  _prepared = facts;
  std::size_t next = 0;
  const auto keep = [&](std::string_view text) -> std::string_view { return _texts[next++] = text; };
  _prepared->sender = keep(facts.sender);
  for (auto* text :
       {&_prepared->productFamily, &_prepared->productModel, &_prepared->osVersion, &_prepared->build}) {
    if (*text) *text = keep(**text);
  }
}

}  // namespace tallyd
