// The rules' steps, in words.

#include <fmt/format.h>

#include "backends/TallyBackend.h"
#include "backends/https-post/EventFilters.h"
#include "framework/TallyKeys.h"
#include "tally-storebag/ExplanationText.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

std::string quoted(std::optional<std::string_view> text) {
  return text ? fmt::format("\"{}\"", *text) : std::string("(none)");
}

const Dictionary& entryAt(const ExplainedBackend& backend, const ReportingStep& step) {
  static const Dictionary kNone;
  const Array* clients = backend.profile.array("clients");
  if (!clients || !step.entryIndex || *step.entryIndex >= clients->size()) return kNone;
  const Dictionary* entry = (*clients)[*step.entryIndex].dictionary();
  return entry ? *entry : kNone;
}

std::string valueText(const Dictionary& entry, std::string_view key) {
  const Value* value = entry.find(key);
  return value ? value->description() : "(none)";
}

std::string clientEntryText(const ReportingStep& step, const Dictionary& entry, const Occasion& occasion) {
  const auto user = tallyctl::userInfo(occasion.session).value_or(Dictionary());
  return fmt::format("clients[{}], client {}, service {}: {} client {}, service {}", *step.entryIndex,
                     quoted(entry.string("client")), quoted(entry.string("service")),
                     step.passed ? "matches" : "does not match",
                     quoted(user.string(kTallyUserInfoClientName)),
                     quoted(user.string(kTallyUserInfoServiceName)));
}

std::string consentText(const ReportingStep& step, const Dictionary& entry, const Occasion& occasion) {
  if (entry.integer("override_dnu").value_or(0) == 1) return "consent: not asked for, override_dnu is 1";
  return fmt::format("consent: {}", occasion.device.consented && step.passed ? "given" : "not given");
}

std::string listText(std::string_view key, const Dictionary& entry, std::string_view what,
                     const std::optional<std::string>& value, bool passed) {
  return fmt::format("{} {}: {} {} {}", key, valueText(entry, key), what, quoted(value),
                     passed ? "passes" : "does not pass");
}

/// What the rules leave of one field.
std::string fieldFate(const EventFilters& filters, const std::string& key, const tallyctl::Message& message) {
  constexpr std::string_view kProbe = "?";
  Dictionary event{{"_method", std::to_string(message.category)}, {"_status", std::to_string(message.type)}};
  event.set(key, kProbe);
  EventFields fields(event);
  filters.filterEvent(fields);
  const EventField* left = fields.find(key);
  if (!left) return "removed";
  return left->string() == TallyBackend::convertIntoSHA256(kProbe) ? "hashed" : "";
}

}  // namespace

std::string ruleText(const ReportingStep& step, const ExplainedBackend& backend, const Occasion& occasion) {
  const Dictionary& entry = entryAt(backend, step);
  switch (step.rule) {
    case ReportingRule::UserInfoNotRequired:
      return step.passed ? "user info: not required by the session, so that no rule of the bag is asked"
                         : "user info: required by the session";
    case ReportingRule::UserInfo:
      return step.passed ? "user info: given" : "user info: not given yet";
    case ReportingRule::ClientList:
      return step.passed ? "clients: there" : "clients: missing";
    case ReportingRule::ClientEntry:
      return clientEntryText(step, entry, occasion);
    case ReportingRule::Consent:
      return consentText(step, entry, occasion);
    case ReportingRule::Locale:
      return listText("locale_whitelist", entry, "country", occasion.device.countryCode, step.passed);
    case ReportingRule::Device:
      return listText("device_whitelist", entry, "device", occasion.device.family, step.passed);
    case ReportingRule::Filters:
      return step.passed ? fmt::format("filters: {} rules", entry.array("filters")->size())
                         : "filters: missing";
    case ReportingRule::Sampling:
      return fmt::format("sampling_threshold {}: factor {} {}", valueText(entry, "sampling_threshold"),
                         occasion.device.samplingFactor, step.passed ? "passes" : "does not pass");
  }
  return {};
}

std::vector<std::string> filterTexts(const ExplainedBackend& backend, const Occasion& occasion) {
  if (!backend.decision || !backend.decision->filters) return {};
  EventFilters filters;
  filters.createFiltersFromArray(*backend.decision->filters);
  Dictionary fields = occasion.message.payload.value_or(Dictionary());
  fields.merge(tallyctl::userInfo(occasion.session).value_or(Dictionary()));
  // Rules may also take the record's own fields away.
  for (const filterTag& rule : filters.rules()) {
    if (rule.key.starts_with('_') || rule.key == "eventTime") fields.set(rule.key, "");
  }
  std::vector<std::string> texts;
  for (const auto& [key, value] : fields) {
    const std::string fate = fieldFate(filters, key, occasion.message);
    if (!fate.empty()) texts.push_back(fmt::format("field {}: {}", key, fate));
  }
  return texts;
}

}  // namespace tallyd::storebagtool
