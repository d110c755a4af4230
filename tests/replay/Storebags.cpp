#include "replay/Storebags.h"

#include <algorithm>
#include <array>
#include <string>

namespace tallyd::replay {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::uint16_t kFirstPort = 4000;
/// 0: datagrams are sent and forgotten.
constexpr std::array<int, 7> kReliablePeriods{8000, 0, 2000, 1000, 0, 5000, 3000};
constexpr int kDefaultPeriod = 8000;
constexpr std::array<std::string_view, 7> kNames{"playhall",  "vitrine", "dialhouse", "lanternbox",
                                                 "broadwave", "hintery", "fennel"};

int indexOf(std::string_view name) {
  int index = 0;
  for (const auto known : kNames) {
    if (known == name) return index;
    ++index;
  }
  return 0;
}

Dictionary clientEntry(int index, int edition) {
  constexpr std::array kThresholds{kHighestEventThreshold, 4, 19};
  Dictionary entry{
      {"client", index % 2 == 0 ? "Studio,atelier" : "Studio"},
      {"hierarchy", index % 3},
      {"override_dnu", (index + edition) % 4 == 0 ? 1 : 0},
      {"locale_whitelist", Array{"DE", "FR"}},
      {"filters", Array{Dictionary{{"key", "caller"}, {"action", "sha256"}},
                        Dictionary{{"key", "share"}, {"action", "remove"}, {"method", 2}}}},
      {"sampling_threshold", edition % 3 == 0 ? 1.0 : 0.7},
      {"event_threshold", kThresholds[static_cast<std::size_t>(edition % 3)]},
      {"post_url", "https://collector.example/" + std::string(kNames[static_cast<std::size_t>(index)])}};
  if (edition % 5 == 1) entry.set("extras_on_internal", 1);
  return entry;
}

Dictionary posts(int index, int edition) {
  Dictionary anyClient = clientEntry(index, edition + 1);
  anyClient.set("client", "");
  anyClient.set("service", "Calls");
  return {{"clients", Array{clientEntry(index, edition), anyClient}},
          {"display_url", "https://collector.example/sessions"}};
}

Dictionary dashboard(int index) {
  Dictionary profile{{"ip", "10.0.0.1"},
                     {"port", kFirstPort + index},
                     {"display_url", "https://dashboard.example/sessions"},
                     {"post_url", "https://dashboard.example/log-data"}};
  if (const int period = kReliablePeriods[static_cast<std::size_t>(index)]) profile.set("reliable", period);
  return profile;
}

Dictionary section(int index, int edition) {
  Dictionary section{{"splunk", posts(index, edition)}, {"dashboard", dashboard(index)}};
  if (index == 1 || index == 6) section.set("https_post", posts(index, edition + 2));
  if (index != 4) section.set("power", Dictionary{});
  if (index % 2 == 0) section.set("upload_server", Dictionary{{"post_url", "https://uploads.example/take"}});
  if (index == 2 || index == 6) section.set("pith", Dictionary{});
  if (index == 5) section.set("mystery", Dictionary{});
  if (index == 5 && edition % 2 == 1) section.set("splunk", Dictionary{{"clients", "none"}});
  if (index == 3 && edition % 4 == 3) section = {};
  return section;
}

}  // namespace

bool isStorebagName(std::string_view name) {
  return std::find(kNames.begin(), kNames.end(), name) != kNames.end();
}

std::optional<std::string_view> storebagNameOf(std::int64_t clientType) {
  constexpr std::int64_t kFirstClientType = 5;
  const std::int64_t index = clientType - kFirstClientType;
  if (index < 0 || index >= static_cast<std::int64_t>(kNames.size())) return std::nullopt;
  return kNames[static_cast<std::size_t>(index)];
}

Dictionary storebagNamed(std::string_view name, int edition) {
  const Dictionary environment = sectionOf(name, edition);
  return {{"version", "edition " + std::to_string(edition)},
          {"release", environment},
          {"quillon_internal", environment}};
}

Dictionary sectionOf(std::string_view name, int edition) { return section(indexOf(name), edition); }

Dictionary storebagWithoutSections() { return {{"version", "empty"}}; }

Dictionary storebagWithoutVersion(std::string_view name, int edition) {
  Dictionary bag = storebagNamed(name, edition);
  bag.remove("version");
  return bag;
}

std::chrono::milliseconds dashboardPeriod(std::uint16_t port) {
  const int period = kReliablePeriods.at(static_cast<std::size_t>(port - kFirstPort));
  return std::chrono::milliseconds(period == 0 ? kDefaultPeriod : period);
}

}  // namespace tallyd::replay
