#include "tally-storebag/KnownKeys.h"

#include <algorithm>
#include <array>

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"
#include "platform/text/UnicodeText.h"

namespace tallyd::storebagtool {

namespace {

using enum Place;
using enum KeyKind;
using enum Presence;

constexpr KnownKey kKeys[] = {
    {Bag, "version", Text, Required, "the daemon ends itself",
     "the bag's version; session records carry it as StorebagVersion"},
    {Bag, "release", Dictionary, Expected, "devices with customer builds get no storebag",
     "the section for customer builds, and for seed builds when \"seed\" is missing"},
    {Bag, "seed", Dictionary, Optional, "seed builds get the section \"release\", with a warning",
     "the section for seed builds"},
    {Bag, "quillon_internal", Dictionary, Optional, "internal builds get no storebag",
     "the section for internal builds"},
    {Bag, "development", Dictionary, Optional, "devices set to development get no storebag",
     "the section for development"},

    {Section, kTallyBackendDashboard, Dictionary, Optional, "no such backend",
     "each message as a UDP datagram to a dashboard server; log data by HTTP"},
    {Section, kTallyBackendUploadServer, Dictionary, Optional, "no such backend",
     "whole files, gzipped, by HTTP"},
    {Section, kTallyBackendHTTPPost, Dictionary, Optional, "no such backend",
     "events as JSON over HTTPS; its hierarchy and its answers are the session's"},
    {Section, kTallyBackendHTTPPost2, Dictionary, Optional, "no such backend",
     "the same under its second name; neither its hierarchy nor its answers count for the session"},
    {Section, kTallyBackendWattbook, Dictionary, Optional, "no such backend",
     "each message as an event of the device's power log"},
    {Section, kTallyBackendPith, Dictionary, Optional, "no such backend",
     "each message to the adaptor in the client's own bundle; client types 7 and 11 have one"},

    {Dashboard, "ip", Text, Required, "no dashboard backend is made",
     "the server's IPv4 address, four numbers with points; names are not looked up"},
    {Dashboard, "port", Integer, Required, "no dashboard backend is made", "the server's UDP port"},
    {Dashboard, "reliable", Integer, Optional, "each datagram is sent once, unacknowledged",
     "delivery with acknowledgements; the number is the timer's period in milliseconds"},
    {Dashboard, "display_url", Text, Optional, "clients hear \"URL not available\"",
     "the page that clients show"},
    {Dashboard, "post_url", Text, Optional, "log data is not uploaded", "where log data is posted"},

    {UploadServer, "post_url", Text, Required, "no upload backend is made", "where files are posted"},
    {UploadServer, "display_url", Text, Optional, "nothing", "kept, and used for nothing here"},

    {HTTPSPost, "clients", DictionaryList, Required, "no HTTPS post backend is made",
     "the rules for each client; the first entry that matches counts"},
    {HTTPSPost, "display_url", Text, Optional, "nothing", "kept, and used for nothing here"},

    {Client, "client", Text, Optional, "any client matches",
     "client names with commas between them, matched whole and without regard to case"},
    {Client, "service", Text, Optional, "any service matches",
     "parts of service names with commas between them, found anywhere in the name without regard to case"},
    {Client, "hierarchy", Integer, Optional, "0", "the session's level among correlated sessions"},
    {Client, "override_dnu", Integer, Optional, "0: nothing leaves without the user's consent",
     "1 reports without the user's consent; every other number does not"},
    {Client, "locale_whitelist", TextList, Required, "reporting is off",
     "parts of country codes; a device without a country passes any list that is not empty"},
    {Client, "device_whitelist", TextList, Optional, "every device passes", "parts of device names"},
    {Client, "filters", DictionaryList, Required, "reporting is off",
     "which fields are removed or hashed; the first rule that fits a field counts"},
    {Client, "sampling_threshold", Real, Required, "reporting is off",
     "a backend reports when its draw is at most this, 0 to 1"},
    {Client, "event_threshold", Integer, Optional, "49",
     "a batch holds one event more than this of each category"},
    {Client, "extras_on_internal", Integer, Optional, "0",
     "any other number puts the device ID in the client identifier's place on internal builds"},
    {Client, "post_url", Text, Expected, "events are posted only where the device's preferences name a URL",
     "where events are posted, unless the device's preferences say otherwise"},

    {Filter, "key", Text, Required, "the rule fits no field",
     "the field, whole and without regard to case; also of the user info"},
    {Filter, "action", Text, Expected, "the field leaves as it is, whatever later rules say",
     "\"remove\" or \"sha256\", in just these letters; anything else leaves the field as it is"},
    {Filter, "method", Integer, Optional, "any category", "the message category that the rule is for"},
    {Filter, "status", Integer, Optional, "any type", "the message type that the rule is for"},
};

std::size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<std::size_t> row(b.size() + 1);
  for (std::size_t j = 0; j <= b.size(); ++j) row[j] = j;
  for (std::size_t i = 1; i <= a.size(); ++i) {
    std::size_t diagonal = row[0];
    row[0] = i;
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i - 1] == b[j - 1] ? 0 : 1);
      diagonal = row[j];
      row[j] = std::min({replaced, row[j] + 1, row[j - 1] + 1});
    }
  }
  return row[b.size()];
}

}  // namespace

std::span<const KnownKey> knownKeys() { return kKeys; }

const KnownKey* knownKey(Place place, std::string_view key) {
  const auto* found =
      std::ranges::find_if(kKeys, [&](const KnownKey& row) { return row.place == place && row.key == key; });
  return found == std::end(kKeys) ? nullptr : found;
}

std::vector<std::string_view> keysOf(Place place) {
  std::vector<std::string_view> keys;
  for (const KnownKey& row : kKeys) {
    if (row.place == place) keys.push_back(row.key);
  }
  return keys;
}

std::string_view nameOf(Place place) {
  constexpr std::array<std::string_view, 9> kNames{"bag",           "environment",        "dashboard",
                                                   "upload_server", "splunk, https_post", "power",
                                                   "pith",          "client entry",       "filter"};
  return kNames[static_cast<std::size_t>(place)];
}

std::string_view nameOf(KeyKind kind) {
  constexpr std::array<std::string_view, 6> kNames{"string",           "integer",    "number",
                                                   "array of strings", "dictionary", "array of dictionaries"};
  return kNames[static_cast<std::size_t>(kind)];
}

std::string_view nameOf(Presence presence) {
  constexpr std::array<std::string_view, 3> kNames{"required", "expected", "optional"};
  return kNames[static_cast<std::size_t>(presence)];
}

std::string_view nearestName(std::string_view text, std::span<const std::string_view> names) {
  constexpr std::size_t kLongestText = 64;  // Longer ones are slips of nothing, and cost time.
  if (text.empty() || text.size() > kLongestText) return {};
  const std::string folded = platform::caseFolded(text);
  std::string_view nearest;
  std::size_t least = text.size() / 3 + 1;  // More slips than this make another word.
  for (const std::string_view name : names) {
    const std::size_t distance = editDistance(folded, name);
    if (distance > least || (distance == least && !nearest.empty())) continue;
    least = distance;
    nearest = name;
  }
  return nearest;
}

}  // namespace tallyd::storebagtool
