#include "backends/https-post/ReportingRules.h"

#include <algorithm>

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"
#include "platform/text/UnicodeText.h"

namespace tallyd {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

template <class Matches>
bool matchList(const MatchList& list, std::optional<std::string_view> wholeString, bool whitelist,
               Matches matches) {
  if (!list || list->empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::any_of(list->begin(), list->end(), [&](std::string_view element) {
    return !element.empty() && matches(*wholeString, element);
  });
}

/// The parts of a comma-separated text, blanks and all.
MatchList splitAtCommas(std::optional<std::string_view> text) {
  if (!text) return std::nullopt;
  std::vector<std::string_view> parts;
  std::size_t start = 0;
  for (auto comma = text->find(','); comma != std::string_view::npos; comma = text->find(',', start)) {
    parts.push_back(text->substr(start, comma - start));
    start = comma + 1;
  }
  parts.push_back(text->substr(start));
  return parts;
}

MatchList stringsOf(const Array* list) {
  if (!list) return std::nullopt;
  std::vector<std::string_view> strings;
  // An element that is no text matches nothing, like an empty one; the list is not empty for it.
  for (const Value& element : *list) strings.push_back(element.string().value_or(""));
  return strings;
}

std::optional<std::int32_t> integer32(const Dictionary& entry, std::string_view key) {
  const auto number = entry.integer(key);
  return number ? std::optional(static_cast<std::int32_t>(*number)) : std::nullopt;
}

const Dictionary* chooseClientEntry(const Array& clients, const Dictionary& userInfo) {
  const auto clientName = userInfo.string(kTallyUserInfoClientName);
  const auto serviceName = userInfo.string(kTallyUserInfoServiceName);
  for (const Value& element : clients) {
    const Dictionary* entry = element.dictionary();
    if (entry && matchExactStringWithList(splitAtCommas(entry->string("client")), clientName, true) &&
        matchStringWithList(splitAtCommas(entry->string("service")), serviceName, true)) {
      return entry;
    }
  }
  return nullptr;
}

/// A decision before any entry was chosen.
ReportingDecision early(ReportingState state, ReportingReason reason) {
  ReportingDecision decision;
  decision.state = state;
  decision.reason = reason;
  return decision;
}

ReportingDecision off(ReportingDecision decision, ReportingReason reason) {
  decision.state = ReportingStateOff;
  decision.reason = reason;
  return decision;
}

DNUType dnuTypeFor(std::int32_t override_dnu, bool consented) {
  if (override_dnu != 1) return DNUTypeConsent;
  return consented ? DNUTypeOverrideConsent : DNUTypeOverrideNoConsent;
}

/// The rules of the chosen entry, in their order; each refusal leaves the later ones unread.
ReportingDecision decideByEntry(const ReportingCircumstances& circumstances, const Dictionary& entry) {
  ReportingDecision decision;
  decision.entry = entry;
  decision.hierarchy = integer32(entry, "hierarchy").value_or(0);
  decision.override_dnu = integer32(entry, "override_dnu").value_or(0);
  decision.dnuType = dnuTypeFor(decision.override_dnu, circumstances.consented);
  if (decision.dnuType == DNUTypeConsent && !circumstances.consented)
    return off(decision, ReportingReason::NoConsent);

  // The flag is false: without a locale list nobody reports, and a device without a country passes any list.
  if (!matchStringWithList(stringsOf(entry.array("locale_whitelist")), circumstances.countryCode, false)) {
    return off(decision, ReportingReason::LocaleNotListed);
  }
  if (!matchStringWithList(stringsOf(entry.array("device_whitelist")), circumstances.productFamily, true)) {
    return off(decision, ReportingReason::DeviceNotListed);
  }
  const Array* filters = entry.array("filters");
  if (!filters) return off(decision, ReportingReason::NoFilters);
  decision.filters = *filters;

  decision.reachedSampling = true;
  const auto threshold = entry.real("sampling_threshold");
  if (threshold) decision.samplingThreshold = *entry.find("sampling_threshold");
  const bool sampled = threshold && circumstances.samplingFactor <= *threshold;
  decision.state = sampled ? ReportingStateOn : ReportingStateOff;
  decision.reason = sampled ? ReportingReason::Sampled : ReportingReason::NotSampled;

  decision.eventThreshold = integer32(entry, "event_threshold");
  decision.extrasOnInternal = integer32(entry, "extras_on_internal");
  if (const auto url = entry.string("post_url")) decision.postURL = std::string(*url);
  return decision;
}

}  // namespace

bool matchExactStringWithList(const MatchList& list, std::optional<std::string_view> wholeString,
                              bool whitelist) {
  return matchList(list, wholeString, whitelist, platform::equalIgnoringCase);
}

bool matchStringWithList(const MatchList& list, std::optional<std::string_view> wholeString, bool whitelist) {
  return matchList(list, wholeString, whitelist, platform::containsIgnoringCase);
}

ReportingDecision decideReporting(const ReportingCircumstances& circumstances) {
  if (!circumstances.requireUserInfo) return early(ReportingStateOn, ReportingReason::UserInfoNotRequired);
  if (!circumstances.userInfo) return early(ReportingStatePending, ReportingReason::NoUserInfo);
  const Array* clients = circumstances.profile.array("clients");
  if (!clients) return early(ReportingStateOff, ReportingReason::NoClientList);
  const Dictionary* entry = chooseClientEntry(*clients, *circumstances.userInfo);
  if (!entry) return early(ReportingStatePending, ReportingReason::NoMatchingClient);
  return decideByEntry(circumstances, *entry);
}

}  // namespace tallyd
