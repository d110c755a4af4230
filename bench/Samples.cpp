#include "Samples.h"

#include <fmt/format.h>

#include <array>
#include <stdexcept>

#include "backends/TallyBackend.h"
#include "backends/https-post/PostBody.h"
#include "framework/TallyKeys.h"

namespace tallyd::bench {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr int kOtherMethod = 9;
constexpr int kOtherStatus = 404;

constexpr const char* kClientName = "com.quillon.client0000";

/// Names of fields that no event has, of 8 to 18 letters.
std::string foreignField(std::size_t number) {
  constexpr std::array<std::string_view, 32> kSubjects{
      "account",  "album",   "artist",   "audio",  "battery", "bookmark", "campaign", "carrier",
      "category", "channel", "chapter",  "credit", "device",  "download", "episode",  "experiment",
      "family",   "genre",   "gift",     "hint",   "library", "offer",    "page",     "player",
      "playlist", "profile", "purchase", "search", "section", "shelf",    "store",    "stream"};
  constexpr std::array<std::string_view, 32> kAspects{
      "Token",  "Count",   "Index",   "Label",    "Origin",   "Region",  "Source", "Status",
      "Target", "Version", "Address", "Language", "Duration", "Quality", "Rank",   "Reason",
      "Result", "Score",   "Session", "Size",     "Stage",    "State",   "Style",  "Subject",
      "Term",   "Total",   "Trigger", "Variant",  "Vendor",   "View",    "Width",  "Zone"};
  return fmt::format("{}{}", kSubjects[number % kSubjects.size()],
                     kAspects[number / kSubjects.size() % kAspects.size()]);
}

/// A rule for the field under `key`; `limits` say for which events.
Value rule(std::string_view key, std::string_view action, const Dictionary& limits = {}) {
  Dictionary made{{"key", key}, {"action", action}};
  made.merge(limits);
  return made;
}

std::vector<Value> fittingRules(Hashing hashing) {
  const char* const action = hashing == Hashing::Yes ? "sha256" : "remove";
  const Dictionary exactly{{"method", kCategory}, {"status", kType}};
  std::vector<Value> rules;
  for (const char* key : {"requestID", "Referrer", "title", "container", "clientName"}) {
    rules.push_back(rule(key, "remove", {{"method", kOtherMethod}}));
    rules.push_back(rule(key, "sha256", {{"status", kOtherStatus}}));
  }
  rules.push_back(rule("requestID", action));
  rules.push_back(rule("Referrer", action, {{"method", kCategory}}));
  rules.push_back(rule("title", "none", exactly));
  rules.push_back(rule("container", "none", {{"status", kType}}));
  rules.push_back(rule("clientName", "none"));
  return rules;
}

Array countriesWith(std::string_view last) {
  return {"DE", "FR", "GB", "ES", "IT", "NL", "JP", "CA", "AU", Value(last)};
}

/// For the client of this number.
Dictionary clientEntry(std::size_t number, std::string_view country) {
  return {{"client", fmt::format("com.quillon.client{0:04},com.quillon.client{0:04}.widget,"
                                 "com.quillon.client{0:04}.share",
                                 number)},
          {"service", "playback,browse"},
          {"hierarchy", 1},
          {"locale_whitelist", countriesWith(country)},
          {"device_whitelist", Array{"Deskframe", "Handset", "Kasten"}},
          {"filters", filterRules(10)},
          {"sampling_threshold", 1.0},
          {"event_threshold", 49},
          {"post_url", "https://collect.quillon.example/events"}};
}

}  // namespace

void NoLog::write(platform::LogLevel /*level*/, std::string_view message) {
  throw std::runtime_error(std::string(message));
}

EventFacts eventFacts(std::size_t number) {
  constexpr double kSessionStart = 1'760'000'123.25;
  return {.sessionStart = kSessionStart,
          .sender = "PH",
          .clientVersion = 1,
          .sessionID = "5Q0kK3sVTv2jXW9mJm0b7A==",
          .eventNumber = static_cast<std::uint16_t>(number),
          .method = kCategory,
          .status = kType,
          .eventTime = kSessionStart + static_cast<double>(number) / 8,
          .productFamily = "Kasten",
          .productModel = "Kasten7,1",
          .osVersion = "12",
          .build = "6.1.0-18-amd64",
          .isInternal = false,
          .reportVersionMajor = 7,
          .reportVersionMinor = 0,
          .timezoneOffset = std::chrono::seconds(3600)};
}

Dictionary userInfo() {
  return {{std::string(kTallyUserInfoClientName), kClientName},
          {std::string(kTallyUserInfoServiceName), "com.quillon.service.playback"}};
}

std::vector<EventRecord> eventRecords(std::size_t count) {
  EventRecords records;
  std::vector<EventRecord> events;
  events.reserve(count);
  for (std::size_t number = 0; number < count; ++number) {
    events.push_back(records.record(payload(number), eventFacts(number)));
  }
  return events;
}

void FreshFields::renew() {
  for (std::size_t number = 0; number < _records.size(); ++number) {
    _records[number].fieldsInto(_fields[number]);
    _fields[number].merge(_userInfo);
  }
}

std::string documentOf(std::size_t events) {
  const Dictionary info = userInfo();
  platform::JSONText array;
  EventFields fields;
  array.startArray();
  for (const EventRecord& record : eventRecords(events)) {
    record.fieldsInto(fields);
    fields.merge(info);
    appendEvent(array, fields);
  }
  array.endArray();
  return documentAround(array.view());
}

std::string documentAround(std::string_view eventArray) {
  return postBody({1'760'000'200, 125'000}, "6f1cbb53-52a8-5f0c-9d0a-0d1a4c6b7e21", eventArray);
}

Array filterRules(std::size_t count, Hashing hashing) {
  std::vector<Value> rules;
  if (count >= kFewestFittingRules) rules = fittingRules(hashing);
  constexpr std::array<const char*, 3> kActions{"remove", "sha256", "none"};
  for (std::size_t number = 0; rules.size() < count; ++number) {
    rules.push_back(rule(foreignField(number), kActions[number % kActions.size()]));
  }
  return Array(std::move(rules));
}

Dictionary postProfile(std::size_t entries, std::string_view country) {
  constexpr std::size_t kSameClient = 5;
  std::vector<Value> clients;
  for (std::size_t number = entries; number-- > 1;) {
    const bool sameClient = number % kSameClient == 0;
    Dictionary entry = clientEntry(sameClient ? 0 : number, country);
    if (sameClient) entry.set("service", "shopping,searching");
    clients.emplace_back(std::move(entry));
  }
  Dictionary last = clientEntry(0, country);
  last.set("event_threshold", kLastEventThreshold);
  clients.emplace_back(std::move(last));
  return {{"clients", Array(std::move(clients))}};
}

Dictionary storebag(const Dictionary& profile) {
  return {{"version", "1.0"}, {"release", Dictionary{{std::string(kTallyBackendHTTPPost), profile}}}};
}

}  // namespace tallyd::bench
