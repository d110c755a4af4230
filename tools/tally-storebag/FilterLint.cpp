// Filter rules: what they fit, what they do, and which of them never come to it.

#include <fmt/format.h>

#include <algorithm>

#include "backends/https-post/EventFilters.h"
#include "platform/text/UnicodeText.h"
#include "tally-storebag/Linter.h"
#include "tally-storebag/ValueLint.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;

namespace {

constexpr std::int64_t kHighestCode = 65'535;  ///< Of a message's category and type.

void lintAction(const Dictionary& rule, const std::string& path, Findings& findings) {
  constexpr std::string_view kActions[] = {"remove", "sha256"};
  const auto action = rule.string("action");
  // A rule that says to leave a field alone is one way to exempt it from later rules.
  if (!action || *action == "none" || std::ranges::count(kActions, *action) > 0) return;
  std::string text = fmt::format("unknown action \"{}\"", *action);
  if (const auto near = nearestName(*action, kActions); !near.empty())
    text += fmt::format("; did you mean \"{}\"?", near);
  findings.push_back({Severity::Error, pathOf(path, "action"), std::move(text),
                      "the field leaves as it is, whatever later rules say"});
}

void lintCode(const Dictionary& rule, std::string_view key, const std::string& path, Findings& findings) {
  const auto code = rule.integer(key);
  if (!code) return;
  if (*code > kHighestCode) {
    findings.push_back({Severity::Error, pathOf(path, key), fmt::format("{} is above 65535", *code),
                        "the rule fits no message"});
  } else if (*code < 0) {
    findings.push_back({Severity::Note, pathOf(path, key), fmt::format("{} is below 0", *code),
                        "the rule fits every message"});
  }
}

void lintKey(const Dictionary& rule, const std::string& path, Findings& findings) {
  const auto key = rule.string("key");
  if (!key) return;
  if (key->empty()) {
    findings.push_back(
        {Severity::Warning, pathOf(path, "key"), "is empty", "the rule fits a field without a name"});
  } else if (hasBlanksAround(*key)) {
    findings.push_back({Severity::Warning, pathOf(path, "key"), fmt::format("blanks around \"{}\"", *key),
                        "the blanks count: the bare field is not touched"});
  }
}

bool coversCode(std::int32_t wide, std::int32_t narrow) { return wide < 0 || wide == narrow; }

bool hides(const filterTag& earlier, const filterTag& later) {
  return platform::equalIgnoringCase(earlier.key, later.key) && coversCode(earlier.method, later.method) &&
         coversCode(earlier.status, later.status);
}

/// Rules that have a key, compiled by the daemon; the others fit nothing and hide nothing.
struct Rule {
  std::size_t index;
  filterTag tag;
};

void lintHidden(const std::vector<Rule>& rules, const std::string& entryPath, Findings& findings) {
  for (std::size_t i = 0; i < rules.size(); ++i) {
    for (std::size_t j = 0; j < i; ++j) {
      if (!hides(rules[j].tag, rules[i].tag)) continue;
      const bool weaker = rules[j].tag.action != rules[i].tag.action;
      findings.push_back({weaker ? Severity::Error : Severity::Warning,
                          pathOf(entryPath, "filters", rules[i].index),
                          fmt::format("filters[{}] fits all that this rule would fit{}", rules[j].index,
                                      weaker ? ", and does otherwise" : ""),
                          "the rule is never applied"});
      break;
    }
  }
}

}  // namespace

void lintFilters(const Array& filters, const std::string& entryPath, Findings& findings) {
  if (filters.empty()) {
    findings.push_back({Severity::Note, pathOf(entryPath, "filters"), "is empty",
                        "every field leaves as it is; rules of an entry chosen before stay in force"});
  }
  EventFilters compiled;
  compiled.createFiltersFromArray(filters);
  std::vector<Rule> rules;
  for (std::size_t i = 0; i < filters.size(); ++i) {
    const std::string path = pathOf(entryPath, "filters", i);
    const Dictionary* rule = filters[i].dictionary();
    if (!rule) {
      findings.push_back({Severity::Error, path, "is not a dictionary", "the rule fits no field"});
      continue;
    }
    lintKeys(*rule, Place::Filter, path, findings);
    lintKey(*rule, path, findings);
    lintAction(*rule, path, findings);
    lintCode(*rule, "method", path, findings);
    lintCode(*rule, "status", path, findings);
    if (rule->string("key")) rules.push_back({i, compiled.rules()[i]});
  }
  lintHidden(rules, entryPath, findings);
}

}  // namespace tallyd::storebagtool
