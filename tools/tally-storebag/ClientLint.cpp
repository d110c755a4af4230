// Client entries: what they match, and whether what they match may report.

#include <fmt/format.h>

#include <algorithm>

#include "platform/text/UnicodeText.h"
#include "tally-storebag/Linter.h"
#include "tally-storebag/ValueLint.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

using Texts = std::vector<std::string>;

constexpr std::size_t kLongestCountryCode = 3;  ///< "DE", or a region such as "419".

bool isDead(const Texts& texts) {
  return std::ranges::all_of(texts, [](const std::string& text) { return text.empty(); });
}

/// What an entry matches; nothing stands for "any".
struct Reach {
  std::optional<Texts> clients;
  std::optional<Texts> services;

  explicit Reach(const Dictionary& entry)
      : clients(partsUnder(entry, "client")), services(partsUnder(entry, "service")) {}

  [[nodiscard]] bool isEmpty() const {
    return (clients && isDead(*clients)) || (services && isDead(*services));
  }
  /// Whether every session of the client `name`, nothing for any, that `other` matches is matched here.
  [[nodiscard]] bool covers(const Reach& other, const std::string* name) const {
    return coversClient(name) && coversServices(other);
  }

 private:
  static std::optional<Texts> partsUnder(const Dictionary& entry, std::string_view key) {
    const auto text = entry.string(key);
    return text ? std::optional(partsOf(*text)) : std::nullopt;
  }
  [[nodiscard]] bool coversClient(const std::string* name) const {
    if (!clients) return true;
    return name && std::ranges::any_of(*clients, [&](const std::string& mine) {
             return platform::equalIgnoringCase(mine, *name);
           });
  }
  /// A name that holds one of the other's parts holds one of these, too.
  [[nodiscard]] bool coversServices(const Reach& other) const {
    if (!services) return true;
    if (!other.services) return false;
    return std::ranges::all_of(*other.services, [&](const std::string& theirs) {
      return theirs.empty() || std::ranges::any_of(*services, [&](const std::string& mine) {
               return platform::containsIgnoringCase(theirs, mine);
             });
    });
  }
};

/// The index of the first of `earlier` that covers the client `name` of `entry`; nothing when none does.
std::optional<std::size_t> coveredBy(const std::vector<std::optional<Reach>>& earlier, const Reach& entry,
                                     const std::string* name) {
  for (std::size_t i = 0; i < earlier.size(); ++i) {
    if (earlier[i] && earlier[i]->covers(entry, name)) return i;
  }
  return std::nullopt;
}

void reportHidden(const std::string& path, std::string_view what, std::size_t index, Severity severity,
                  Findings& findings) {
  findings.push_back(
      {severity, path, fmt::format("clients[{}] matches {} before", index, what),
       severity == Severity::Error ? "the entry is never chosen" : "the entry is not chosen for it"});
}

void lintHidden(const std::vector<std::optional<Reach>>& earlier, const Reach& entry, const std::string& path,
                Findings& findings) {
  if (!entry.clients) {
    if (const auto index = coveredBy(earlier, entry, nullptr))
      reportHidden(path, "all that this entry would match", *index, Severity::Error, findings);
    return;
  }
  std::vector<std::pair<std::string, std::size_t>> hidden;
  std::size_t names = 0;
  for (const std::string& name : *entry.clients) {
    if (name.empty()) continue;
    ++names;
    if (const auto index = coveredBy(earlier, entry, &name)) hidden.emplace_back(name, *index);
  }
  const Severity severity = hidden.size() == names ? Severity::Error : Severity::Warning;
  for (const auto& [name, index] : hidden)
    reportHidden(path, fmt::format("\"{}\"", name), index, severity, findings);
}

void lintLocales(const Dictionary& entry, const std::string& path, Findings& findings) {
  const Array* list = entry.array("locale_whitelist");
  if (!list) return;
  const std::string place = pathOf(path, "locale_whitelist");
  if (list->empty()) {
    findings.push_back({Severity::Error, place, "is empty", "reporting is off"});
    return;
  }
  const Texts texts = textsOf(*list);
  lintTexts(texts, Matching::Part, place, findings);
  const auto tooLong = [](const std::string& text) { return text.size() > kLongestCountryCode; };
  for (const std::string& text : texts) {
    if (tooLong(text))
      findings.push_back({Severity::Warning, place, fmt::format("\"{}\" is longer than a country code", text),
                          "matches no country"});
    if (text.size() == 1)
      findings.push_back({Severity::Note, place, fmt::format("\"{}\" is a single letter", text),
                          "matches every country code that holds it"});
  }
  if (std::ranges::all_of(texts, [&](const auto& text) { return text.empty() || tooLong(text); }))
    findings.push_back({Severity::Error, place, "no country can match", "reporting is off"});
}

void lintDevices(const Dictionary& entry, const std::string& path, Findings& findings) {
  const Array* list = entry.array("device_whitelist");
  if (!list) return;
  const std::string place = pathOf(path, "device_whitelist");
  const Texts texts = textsOf(*list);
  lintTexts(texts, Matching::Part, place, findings);
  if (texts.empty()) {
    findings.push_back({Severity::Note, place, "is empty", "every device passes"});
  } else if (isDead(texts)) {
    findings.push_back({Severity::Error, place, "no device can match", "reporting is off"});
  }
}

void lintThresholds(const Dictionary& entry, const std::string& path, Findings& findings) {
  if (const auto share = entry.real("sampling_threshold")) {
    const std::string place = pathOf(path, "sampling_threshold");
    const std::string text = fmt::format("{} is not from 0 to 1", *share);
    if (*share < 0) findings.push_back({Severity::Error, place, text, "reporting is off"});
    if (*share > 1) findings.push_back({Severity::Warning, place, text, "every session reports, as with 1"});
    if (*share == 0)
      findings.push_back({Severity::Warning, place, "is 0", "only a session that draws just 0 reports"});
  }
  if (const auto limit = entry.integer("event_threshold"); limit && *limit < 0)
    findings.push_back({Severity::Error, pathOf(path, "event_threshold"),
                        fmt::format("{} is below 0", *limit), "no event is batched"});
}

void lintConsent(const Dictionary& entry, const std::string& path, Findings& findings) {
  const auto override = entry.integer("override_dnu").value_or(0);
  const std::string place = pathOf(path, "override_dnu");
  if (override == 1)
    findings.push_back({Severity::Note, place, "is 1", "reports leave without the user's consent"});
  else if (override != 0)
    findings.push_back(
        {Severity::Warning, place, fmt::format("{} is neither 0 nor 1", override), "reads as 0"});
  if (entry.integer("extras_on_internal").value_or(0) != 0)
    findings.push_back({Severity::Note, pathOf(path, "extras_on_internal"), "is not 0",
                        "the device ID leaves as the client identifier on internal builds"});
}

void lintNames(const Reach& reach, const std::string& path, Findings& findings) {
  if (reach.clients) lintTexts(*reach.clients, Matching::Whole, pathOf(path, "client"), findings);
  if (reach.services) lintTexts(*reach.services, Matching::Part, pathOf(path, "service"), findings);
  if (reach.isEmpty())
    findings.push_back({Severity::Error, path, "no client can match", "the entry is never chosen"});
}

Reach lintEntry(const Dictionary& entry, const std::string& path, Findings& findings) {
  const Reach reach(entry);
  lintKeys(entry, Place::Client, path, findings);
  lintNames(reach, path, findings);
  lintConsent(entry, path, findings);
  lintLocales(entry, path, findings);
  lintDevices(entry, path, findings);
  if (const Array* filters = entry.array("filters")) lintFilters(*filters, path, findings);
  lintThresholds(entry, path, findings);
  lintURL(entry, "post_url", path, findings);
  return reach;
}

}  // namespace

void lintClients(const Array& clients, const std::string& profilePath, Findings& findings) {
  std::vector<std::optional<Reach>> earlier;
  bool anyMatches = false;
  for (std::size_t i = 0; i < clients.size(); ++i) {
    const std::string path = pathOf(profilePath, "clients", i);
    std::optional<Reach> reach;
    if (const Dictionary* entry = clients[i].dictionary()) {
      reach = lintEntry(*entry, path, findings);
      lintHidden(earlier, *reach, path, findings);
    } else {
      findings.push_back({Severity::Error, path, "is not a dictionary", "ignored"});
    }
    anyMatches = anyMatches || (reach && !reach->isEmpty());
    earlier.push_back(std::move(reach));
  }
  if (!anyMatches)
    findings.push_back({Severity::Error, pathOf(profilePath, "clients"), "no client can match any entry",
                        "sessions that require user info batch their events and never post them"});
}

}  // namespace tallyd::storebagtool
