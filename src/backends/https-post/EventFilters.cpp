#include "backends/https-post/EventFilters.h"

#include <algorithm>

#include "backends/TallyBackend.h"
#include "platform/text/UnicodeText.h"

namespace tallyd {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

std::int32_t actionNamed(std::optional<std::string_view> name) {
  if (name == "remove") return FilterActionRemove;
  if (name == "sha256") return FilterActionSHA256;
  return FilterActionNone;
}

filterTag compiled(const Dictionary& rule) {
  return {.method = static_cast<std::int32_t>(rule.integer("method").value_or(filterTag::kAny)),
          .status = static_cast<std::int32_t>(rule.integer("status").value_or(filterTag::kAny)),
          .action = actionNamed(rule.string("action")),
          .key = std::string(rule.string("key").value_or(""))};
}

bool fits(std::int32_t wanted, std::int64_t actual) { return wanted < 0 || wanted == actual; }

}  // namespace

void EventFilters::createFiltersFromArray(const Array& filters) {
  if (filters.empty()) return;
  _rules.clear();
  _rulesByFoldedKey.clear();
  _keyLengths.reset();
  _rules.reserve(filters.size());
  for (const Value& element : filters) {
    const Dictionary* rule = element.dictionary();
    _rules.push_back(rule ? compiled(*rule) : filterTag());
    const filterTag& tag = _rules.back();
    const bool hasKey = rule && rule->string("key");
    if (!hasKey) continue;
    const std::string folded = platform::caseFolded(tag.key);
    _rulesByFoldedKey[folded].push_back(_rules.size() - 1);
    _keyLengths.set(std::min(folded.size(), kCountedLength));
  }
}

void EventFilters::filterEvent(Dictionary& event) const {
  if (_rulesByFoldedKey.empty()) return;
  const std::int64_t method = event.integer("_method").value_or(0);
  const std::int64_t status = event.integer("_status").value_or(0);
  const Dictionary before = event;
  for (const auto& [key, value] : before) {
    const filterTag* rule = ruleFor(key, method, status);
    if (!rule) continue;
    if (rule->action == FilterActionRemove) event.remove(key);
    if (rule->action == FilterActionSHA256) {
      event.set(key, TallyBackend::convertIntoSHA256(value.string().value_or(value.description())));
    }
  }
}

const filterTag* EventFilters::ruleFor(std::string_view key, std::int64_t method, std::int64_t status) const {
  // Folding leaves the length of ASCII as it is, and most fields have no rule.
  if (!_keyLengths[std::min(key.size(), kCountedLength)] && platform::isASCII(key)) return nullptr;
  const auto found = _rulesByFoldedKey.find(platform::caseFolded(key));
  if (found == _rulesByFoldedKey.end()) return nullptr;
  for (const std::size_t index : found->second) {
    const filterTag& rule = _rules[index];
    if (fits(rule.method, method) && fits(rule.status, status)) return &rule;
  }
  return nullptr;
}

}  // namespace tallyd
