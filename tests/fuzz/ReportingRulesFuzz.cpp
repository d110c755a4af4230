// A storebag's rules against a session and an event: who reports, what is removed or hashed, what is posted.

#include <algorithm>
#include <optional>
#include <string>

#include "FuzzTarget.h"
#include "backends/TallyBackend.h"
#include "backends/https-post/EventFilters.h"
#include "backends/https-post/EventRecord.h"
#include "backends/https-post/PostBody.h"
#include "backends/https-post/ReportingRules.h"
#include "fakes/FakeLog.h"
#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "platform/text/UnicodeText.h"

namespace tallyd::fuzz {
namespace {

using namespace platform;

/// JSON, or a property list, which also has dates and data.
std::optional<Dictionary> dictionaryIn(std::string_view text) {
  auto value = valueFromJSON(text).value;
  if (!value) value = propertyListWithData(text).value;
  return value && value->dictionary() ? std::optional(*value->dictionary()) : std::nullopt;
}

void checkDecision(const ReportingCircumstances& circumstances, const ReportingDecision& decision,
                   const ReportingTrace& trace) {
  const bool isOn = decision.state == ReportingStateOn;
  FUZZ_CHECK(isOn == (decision.reason == ReportingReason::UserInfoNotRequired ||
                      decision.reason == ReportingReason::Sampled));
  FUZZ_CHECK(!trace.empty());
  FUZZ_CHECK(trace.back().passed == isOn);
  if (!isOn || !circumstances.requireUserInfo) return;
  // Nobody reports without consent unless the storebag overrides it, nor without filters.
  FUZZ_CHECK(circumstances.consented || decision.override_dnu == 1);
  FUZZ_CHECK(decision.filters && decision.entry && decision.reachedSampling);
  FUZZ_CHECK(decision.samplingThreshold->realValue() >= circumstances.samplingFactor);
}

/// The rule for a field, found the slow way.
const Dictionary* ruleFor(const Array& filters, std::string_view key, std::int64_t method,
                          std::int64_t status) {
  const auto fits = [](const Dictionary& rule, std::string_view which, std::int64_t actual) {
    const auto wanted = static_cast<std::int32_t>(rule.integer(which).value_or(-1));
    return wanted < 0 || wanted == actual;
  };
  for (const Value& element : filters) {
    const Dictionary* rule = element.dictionary();
    if (rule && rule->string("key") && caseFolded(*rule->string("key")) == caseFolded(key) &&
        fits(*rule, "method", method) && fits(*rule, "status", status)) {
      return rule;
    }
  }
  return nullptr;
}

bool isDigest(std::string_view text) {
  return text.size() == 64 && std::all_of(text.begin(), text.end(), [](char c) {
           return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
         });
}

void checkFilters(const Array& filters, const Dictionary& before, const Dictionary& after) {
  const auto method = before.integer("_method").value_or(0);
  const auto status = before.integer("_status").value_or(0);
  for (const auto& [key, value] : before) {
    const Dictionary* rule = ruleFor(filters, key, method, status);
    const auto action = rule ? rule->string("action") : std::nullopt;
    const Value* left = after.find(key);
    FUZZ_CHECK((action == "remove") == (left == nullptr));
    if (action == "remove") continue;
    if (action == "sha256") {
      FUZZ_CHECK(isDigest(left->string().value_or("")));
    } else {
      FUZZ_CHECK(left->description() == value.description());
    }
  }
  FUZZ_CHECK(after.size() <= before.size());
}

void checkPost(EventFields& event) {
  fakes::FakeLog log;
  sanitizeEventForJSON(event, log);
  JSONText array;
  array.startArray();
  appendEvent(array, event);
  array.endArray();
  const auto read = valueFromJSON(postBody({1'763'712'000, 5'000}, "client", array.view()));
  FUZZ_CHECK(read.value && read.value->dictionary());
  const Array* events = read.value->dictionary()->array("events");
  FUZZ_CHECK(events && events->size() == 1);
  const Dictionary* posted = (*events)[0].dictionary();
  FUZZ_CHECK(posted && posted->size() == event.dictionary().size());
}

}  // namespace
}  // namespace tallyd::fuzz

/// Lines: flags and sampling, product family, country, user info, event, profile (which may have several).
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  using namespace tallyd;
  Input input(data, size);
  ReportingCircumstances circumstances;
  const std::uint8_t flags = input.takeByte();
  circumstances.requireUserInfo = (flags & 1U) != 0;
  circumstances.consented = (flags & 2U) != 0;
  circumstances.samplingFactor = input.takeByte() / 256.0;
  (void)input.takeLine();
  if (const auto family = input.takeLine(); !family.empty()) circumstances.productFamily = family;
  if (const auto country = input.takeLine(); !country.empty()) circumstances.countryCode = country;
  circumstances.userInfo = dictionaryIn(input.takeLine());
  const auto payload = dictionaryIn(input.takeLine());
  circumstances.profile = dictionaryIn(input.takeRest()).value_or(Dictionary());

  ReportingTrace trace;
  const ReportingDecision decision = decideReporting(circumstances, &trace);
  checkDecision(circumstances, decision, trace);
  FUZZ_CHECK(decideReporting(circumstances).reason == decision.reason);
  Array filters = decision.filters.value_or(Array());
  if (const Array* own = circumstances.profile.array("filters")) filters = *own;

  EventFacts facts;
  facts.method = flags % 5;
  facts.status = flags % 3;
  facts.sender = "PH";
  EventRecords records;
  const EventRecord record = records.record(payload, facts);
  EventFields event;
  record.fieldsInto(event);
  const Dictionary before = event.dictionary();
  FUZZ_CHECK(before.integer("_method") == facts.method);
  EventFilters compiled;
  compiled.createFiltersFromArray(filters);
  compiled.filterEvent(event);
  checkFilters(filters, before, event.dictionary());
  checkPost(event);
  return 0;
}
