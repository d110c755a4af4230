#include "backends/https-post/EventRecord.h"

#include <fmt/format.h>

namespace tallyd {

using platform::Dictionary;
using platform::Value;

std::int64_t truncateToMinute(std::int64_t seconds) {
  constexpr std::int64_t kMinute = 60;
  return seconds / kMinute * kMinute;
}

Dictionary eventRecord(const std::optional<Dictionary>& payload, const EventFacts& facts) {
  const std::int64_t startMinute = truncateToMinute(static_cast<std::int64_t>(facts.sessionStart));
  const Value shiftedTime =
      fmt::format("{:.3f}", static_cast<double>(startMinute) + (facts.eventTime - facts.sessionStart));
  std::vector<Dictionary::Entry> entries{
      {"_startTS", fmt::format("{}", startMinute)},
      {"_sender", facts.sender},
      {"_clientVersion", fmt::format("{}", facts.clientVersion)},
      {"_sessionID", facts.sessionID},
      {"_eventNumber", fmt::format("{}", facts.eventNumber)},
      {"_method", fmt::format("{}", facts.method)},
      {"_status", fmt::format("{}", facts.status)},
      {"_clientTS", shiftedTime},
      {"eventTime", shiftedTime},
      {"_internal", facts.isInternal ? "1" : "0"},
      {"_reportVers", fmt::format("{}.{}", facts.reportVersionMajor, facts.reportVersionMinor)},
      {"_timezoneOffset", static_cast<std::int64_t>(facts.timezoneOffset.count())},
  };
  Dictionary record = payload.value_or(Dictionary());
  const auto setOrRemove = [&](std::string_view key, const std::optional<std::string>& text) {
    if (text) {
      entries.push_back({std::string(key), *text});
    } else {
      record.remove(key);
    }
  };
  setOrRemove("_productFamily", facts.productFamily);
  setOrRemove("_productModel", facts.productModel);
  setOrRemove("_osVersion", facts.osVersion);
  setOrRemove("_build", facts.build);
  record.merge(Dictionary(std::move(entries)));
  return record;
}

}  // namespace tallyd
