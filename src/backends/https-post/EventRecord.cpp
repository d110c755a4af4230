#include "backends/https-post/EventRecord.h"

#include <fmt/format.h>

#include <algorithm>
#include <tuple>

namespace tallyd {

using platform::Dictionary;
using platform::Value;

namespace {

/// The facts that seldom change within a session.
auto commonFacts(const EventFacts& facts) {
  return std::tie(facts.sessionStart, facts.sender, facts.clientVersion, facts.sessionID, facts.productFamily,
                  facts.productModel, facts.osVersion, facts.build, facts.isInternal,
                  facts.reportVersionMajor, facts.reportVersionMinor);
}

std::string decimal(std::int64_t number) { return fmt::format_int(number).str(); }

std::size_t placeOf(std::string_view key, const std::vector<Dictionary::Entry>& entries) {
  const auto found = std::find_if(entries.begin(), entries.end(),
                                  [key](const Dictionary::Entry& entry) { return entry.key == key; });
  return static_cast<std::size_t>(found - entries.begin());
}

}  // namespace

std::int64_t truncateToMinute(std::int64_t seconds) {
  constexpr std::int64_t kMinute = 60;
  return seconds / kMinute * kMinute;
}

Dictionary EventRecords::record(const std::optional<Dictionary>& payload, const EventFacts& facts) {
  if (!_prepared || commonFacts(*_prepared) != commonFacts(facts)) prepare(facts);
  const Value shiftedTime = fmt::format("{:.3f}", _startMinute + (facts.eventTime - facts.sessionStart));
  std::vector<Dictionary::Entry> entries = _common;
  entries[_places.clientTime].value = shiftedTime;
  entries[_places.eventTime].value = shiftedTime;
  entries[_places.eventNumber].value = decimal(facts.eventNumber);
  entries[_places.method].value = decimal(facts.method);
  entries[_places.status].value = decimal(facts.status);
  entries[_places.timezoneOffset].value = static_cast<std::int64_t>(facts.timezoneOffset.count());
  Dictionary record = payload.value_or(Dictionary());
  for (const std::string_view key : _missing) record.remove(key);
  record.merge(Dictionary(std::move(entries)));
  return record;
}

void EventRecords::prepare(const EventFacts& facts) {
  const std::int64_t startMinute = truncateToMinute(static_cast<std::int64_t>(facts.sessionStart));
  _startMinute = static_cast<double>(startMinute);
  _common = {{"_clientTS", nullptr},
             {"_clientVersion", decimal(facts.clientVersion)},
             {"_eventNumber", nullptr},
             {"_internal", facts.isInternal ? "1" : "0"},
             {"_method", nullptr},
             {"_reportVers", fmt::format("{}.{}", facts.reportVersionMajor, facts.reportVersionMinor)},
             {"_sender", facts.sender},
             {"_sessionID", facts.sessionID},
             {"_startTS", decimal(startMinute)},
             {"_status", nullptr},
             {"_timezoneOffset", nullptr},
             {"eventTime", nullptr}};
  _missing.clear();
  const auto addIfKnown = [this](std::string_view key, const std::optional<std::string_view>& text) {
    if (text) {
      _common.push_back({std::string(key), *text});
    } else {
      _missing.push_back(key);
    }
  };
  addIfKnown("_productFamily", facts.productFamily);
  addIfKnown("_productModel", facts.productModel);
  addIfKnown("_osVersion", facts.osVersion);
  addIfKnown("_build", facts.build);
  std::sort(_common.begin(), _common.end(),
            [](const Dictionary::Entry& a, const Dictionary::Entry& b) { return a.key < b.key; });
  _places = {placeOf("_clientTS", _common),       placeOf("_eventNumber", _common),
             placeOf("_method", _common),         placeOf("_status", _common),
             placeOf("_timezoneOffset", _common), placeOf("eventTime", _common)};
  remember(facts);
}

/// With texts of our own.
void EventRecords::remember(const EventFacts& facts) {
  _prepared = facts;
  std::size_t next = 0;
  const auto keep = [&](std::string_view text) -> std::string_view { return _texts[next++] = text; };
  _prepared->sender = keep(facts.sender);
  _prepared->sessionID = keep(facts.sessionID);
  for (auto* text :
       {&_prepared->productFamily, &_prepared->productModel, &_prepared->osVersion, &_prepared->build}) {
    if (*text) *text = keep(**text);
  }
}

}  // namespace tallyd
