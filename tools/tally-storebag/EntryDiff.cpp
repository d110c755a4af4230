// Client entries compared: who is chosen for whom, and what the chosen ones let go.

#include <fmt/format.h>

#include <algorithm>
#include <map>
#include <optional>

#include "backends/TallyBackend.h"
#include "backends/https-post/HTTPSPostBackend.h"
#include "backends/https-post/ReportingRules.h"
#include "framework/TallyKeys.h"
#include "platform/text/UnicodeText.h"
#include "tally-storebag/BagDiff.h"
#include "tally-storebag/ValueLint.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;

namespace {

using Texts = std::vector<std::string>;

/// A name that no bag holds: a private-use character.
constexpr std::string_view kAnyOther = "\xEF\xA3\xBF";

std::string shown(std::string_view name) {
  return name == kAnyOther ? "any other" : fmt::format("\"{}\"", name);
}

void addName(Texts& names, std::string_view name) {
  if (name.empty()) return;
  const auto same = [&](const std::string& other) { return platform::equalIgnoringCase(other, name); };
  if (std::ranges::none_of(names, same)) names.emplace_back(name);
}

/// All names that the entries of either profile hold under `key`, and one that they don't.
Texts namesUnder(std::string_view key, const Dictionary& before, const Dictionary& after) {
  Texts names;
  for (const Dictionary* profile : {&before, &after}) {
    const Array* clients = profile->array("clients");
    if (!clients) continue;
    for (const auto& element : *clients) {
      const Dictionary* entry = element.dictionary();
      const auto text = entry ? entry->string(key) : std::nullopt;
      if (!text) continue;
      for (const auto& part : partsOf(*text)) addName(names, part);
    }
  }
  names.emplace_back(kAnyOther);
  return names;
}

/// The index of the entry that the daemon chooses.
std::optional<std::size_t> chosen(const Dictionary& profile, const std::string& client,
                                  const std::string& service) {
  const Dictionary userInfo{{std::string(kTallyUserInfoClientName), client},
                            {std::string(kTallyUserInfoServiceName), service}};
  ReportingTrace trace;
  ReportingCircumstances circumstances;
  circumstances.profile = profile;
  circumstances.requireUserInfo = true;
  circumstances.userInfo = userInfo;
  circumstances.consented = true;
  const auto decision = decideReporting(circumstances, &trace);
  return decision.entry ? trace.back().entryIndex : std::nullopt;
}

const Dictionary* entryAt(const Dictionary& profile, std::optional<std::size_t> index) {
  return index ? (*profile.array("clients"))[*index].dictionary() : nullptr;
}

/// Whether anybody at all may report by the entry.
bool canReport(const Dictionary* entry) {
  if (!entry || !entry->array("filters")) return false;
  const Array* locales = entry->array("locale_whitelist");
  return locales && !locales->empty() && entry->real("sampling_threshold").value_or(-1) >= 0;
}

/// Elements of `list` that the other list does not let through; a text holds every part of itself.
Texts notIn(const Texts& list, const Texts& other) {
  Texts missing;
  for (const std::string& text : list) {
    const bool isThere = text.empty() || std::ranges::any_of(other, [&](const std::string& part) {
                           return platform::containsIgnoringCase(text, part);
                         });
    if (!isThere) missing.push_back(text);
  }
  return missing;
}

void diffLists(const Texts& before, const Texts& after, std::string_view what, const std::string& path,
               Changes& changes) {
  const auto report = [&](Exposure exposure, const Texts& texts, std::string_view verb) {
    for (const std::string& text : texts)
      changes.push_back({exposure, path, fmt::format("{} \"{}\" {} reporting", what, text, verb)});
  };
  report(Exposure::Grows, notIn(after, before), "starts");
  report(Exposure::Shrinks, notIn(before, after), "stops");
}

Texts listUnder(const Dictionary& entry, std::string_view key) {
  const Array* list = entry.array(key);
  return list ? textsOf(*list) : Texts();
}

void diffDevices(const Dictionary& before, const Dictionary& after, const std::string& path,
                 Changes& changes) {
  const std::string place = pathOf(path, "device_whitelist");
  const Texts old = listUnder(before, "device_whitelist");
  const Texts now = listUnder(after, "device_whitelist");
  if (old.empty() && now.empty()) return;
  if (now.empty()) return changes.push_back({Exposure::Grows, place, "every device starts reporting"});
  if (old.empty())
    return changes.push_back({Exposure::Shrinks, place, "devices that are not listed stop reporting"});
  diffLists(old, now, "device", place, changes);
}

/// A number of which a greater one lets more go.
void diffNumber(double before, double after, const std::string& path, Changes& changes) {
  if (before == after) return;
  changes.push_back(
      {after > before ? Exposure::Grows : Exposure::Shrinks, path, fmt::format("{} -> {}", before, after)});
}

double share(const Dictionary& entry) {
  return std::clamp(entry.real("sampling_threshold").value_or(0), 0.0, 1.0);
}

double eventThreshold(const Dictionary& entry) {
  return static_cast<double>(
      entry.integer("event_threshold").value_or(HTTPSPostBackend::kDefaultEventThreshold));
}

bool asksConsent(const Dictionary& entry) { return entry.integer("override_dnu").value_or(0) != 1; }
bool sendsDeviceID(const Dictionary& entry) { return entry.integer("extras_on_internal").value_or(0) != 0; }

void diffTerms(const Dictionary& before, const Dictionary& after, const std::string& path, Changes& changes) {
  if (asksConsent(before) != asksConsent(after))
    changes.push_back({asksConsent(before) ? Exposure::Grows : Exposure::Shrinks,
                       pathOf(path, "override_dnu"),
                       asksConsent(before) ? "reports start to leave without the user's consent"
                                           : "reports leave with the user's consent only"});
  if (sendsDeviceID(before) != sendsDeviceID(after))
    changes.push_back({sendsDeviceID(after) ? Exposure::Grows : Exposure::Shrinks,
                       pathOf(path, "extras_on_internal"),
                       sendsDeviceID(after) ? "internal builds start to send the device ID"
                                            : "internal builds stop sending the device ID"});
  const auto hierarchy = [](const Dictionary& entry) { return entry.integer("hierarchy").value_or(0); };
  if (hierarchy(before) != hierarchy(after))
    changes.push_back({Exposure::Same, pathOf(path, "hierarchy"),
                       fmt::format("{} -> {}", hierarchy(before), hierarchy(after))});
}

}  // namespace

void diffEntries(const Dictionary* before, const Dictionary* after, const std::string& path,
                 Changes& changes) {
  const bool reported = canReport(before);
  const bool reports = canReport(after);
  if (!reported && !reports) return;
  if (!reported) return changes.push_back({Exposure::Grows, path, "starts reporting"});
  if (!reports) return changes.push_back({Exposure::Shrinks, path, "stops reporting"});
  diffTerms(*before, *after, path, changes);
  diffLists(listUnder(*before, "locale_whitelist"), listUnder(*after, "locale_whitelist"), "country",
            pathOf(path, "locale_whitelist"), changes);
  diffDevices(*before, *after, path, changes);
  diffFilters(*before->array("filters"), *after->array("filters"), pathOf(path, "filters"), changes);
  diffNumber(share(*before), share(*after), pathOf(path, "sampling_threshold"), changes);
  diffNumber(eventThreshold(*before), eventThreshold(*after), pathOf(path, "event_threshold"), changes);
  diffDestination(*before, *after, "post_url", path, changes);
}

void diffClients(const Dictionary& before, const Dictionary& after, const std::string& path,
                 Changes& changes) {
  using Pair = std::pair<std::optional<std::size_t>, std::optional<std::size_t>>;
  const Texts services = namesUnder("service", before, after);
  // Clients with the same two entries share their changes.
  std::map<Pair, Texts> whom;
  for (const auto& client : namesUnder("client", before, after)) {
    for (const auto& service : services) {
      const Pair entries{chosen(before, client, service), chosen(after, client, service)};
      whom[entries].push_back(fmt::format("client {}, service {}", shown(client), shown(service)));
    }
  }
  for (const auto& [entries, names] : whom) {
    Changes found;
    diffEntries(entryAt(before, entries.first), entryAt(after, entries.second), "", found);
    for (Change& change : found) {
      std::string where = pathOf(path, fmt::format("({})", fmt::join(names, "; ")));
      if (!change.path.empty()) where = pathOf(where, change.path);
      changes.push_back({change.exposure, std::move(where), std::move(change.text)});
    }
  }
}

}  // namespace tallyd::storebagtool
