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

/// Writes down the steps for whoever asked for them.
class Steps {
 public:
  explicit Steps(ReportingTrace* trace) : _trace(trace) {}

  void atEntry(std::size_t index) { _entryIndex = index; }
  /// Gives `passed` back.
  bool take(ReportingRule rule, bool passed) {
    if (_trace) _trace->push_back({rule, passed, _entryIndex});
    return passed;
  }

 private:
  ReportingTrace* _trace;
  std::optional<std::size_t> _entryIndex;
};

const Dictionary* chooseClientEntry(const Array& clients, const Dictionary& userInfo, Steps& steps) {
  const auto clientName = userInfo.string(kTallyUserInfoClientName);
  const auto serviceName = userInfo.string(kTallyUserInfoServiceName);
  for (std::size_t i = 0; i < clients.size(); ++i) {
    const Dictionary* entry = clients[i].dictionary();
    steps.atEntry(i);
    const bool matches = entry &&
                         matchExactStringWithList(splitAtCommas(entry->string("client")), clientName, true) &&
                         matchStringWithList(splitAtCommas(entry->string("service")), serviceName, true);
    if (steps.take(ReportingRule::ClientEntry, matches)) return entry;
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
ReportingDecision decideByEntry(const ReportingCircumstances& circumstances, const Dictionary& entry,
                                Steps& steps) {
  ReportingDecision decision;
  decision.entry = entry;
  decision.hierarchy = integer32(entry, "hierarchy").value_or(0);
  decision.override_dnu = integer32(entry, "override_dnu").value_or(0);
  decision.dnuType = dnuTypeFor(decision.override_dnu, circumstances.consented);
  const bool mayReport = decision.dnuType != DNUTypeConsent || circumstances.consented;
  if (!steps.take(ReportingRule::Consent, mayReport)) return off(decision, ReportingReason::NoConsent);

  // The flag is false: without a locale list nobody reports, and a device without a country passes any list.
  const bool inLocale =
      matchStringWithList(stringsOf(entry.array("locale_whitelist")), circumstances.countryCode, false);
  if (!steps.take(ReportingRule::Locale, inLocale)) return off(decision, ReportingReason::LocaleNotListed);
  const bool onDevice =
      matchStringWithList(stringsOf(entry.array("device_whitelist")), circumstances.productFamily, true);
  if (!steps.take(ReportingRule::Device, onDevice)) return off(decision, ReportingReason::DeviceNotListed);
  const Array* filters = entry.array("filters");
  if (!steps.take(ReportingRule::Filters, filters != nullptr))
    return off(decision, ReportingReason::NoFilters);
  decision.filters = *filters;

  decision.reachedSampling = true;
  const auto threshold = entry.real("sampling_threshold");
  if (threshold) decision.samplingThreshold = *entry.find("sampling_threshold");
  const bool sampled =
      steps.take(ReportingRule::Sampling, threshold && circumstances.samplingFactor <= *threshold);
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

ReportingDecision decideReporting(const ReportingCircumstances& circumstances, ReportingTrace* trace) {
  Steps steps(trace);
  if (steps.take(ReportingRule::UserInfoNotRequired, !circumstances.requireUserInfo))
    return early(ReportingStateOn, ReportingReason::UserInfoNotRequired);
  if (!steps.take(ReportingRule::UserInfo, circumstances.userInfo.has_value()))
    return early(ReportingStatePending, ReportingReason::NoUserInfo);
  const Array* clients = circumstances.profile.array("clients");
  if (!steps.take(ReportingRule::ClientList, clients != nullptr))
    return early(ReportingStateOff, ReportingReason::NoClientList);
  const Dictionary* entry = chooseClientEntry(*clients, *circumstances.userInfo, steps);
  if (!entry) return early(ReportingStatePending, ReportingReason::NoMatchingClient);
  return decideByEntry(circumstances, *entry, steps);
}

}  // namespace tallyd
