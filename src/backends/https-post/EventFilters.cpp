#include "backends/https-post/EventFilters.h"

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

std::int64_t numberUnder(std::string_view key, const EventFields& event) {
  const EventField* field = event.find(key);
  return field ? field->integer().value_or(0) : 0;
}

/// A number below `count` by a key's length and first character: the same for ASCII keys that differ only in
/// case.
std::size_t shapeOf(std::string_view key, std::size_t count) {
  constexpr unsigned kCaseBit = 0x20;
  constexpr std::size_t kSpread = 31;
  const unsigned first = key.empty() ? 0 : static_cast<unsigned char>(key[0]) | kCaseBit;
  return (key.size() * kSpread + first) % count;
}

bool fits(std::int32_t wanted, std::int64_t actual) { return wanted < 0 || wanted == actual; }

}  // namespace

void EventFilters::createFiltersFromArray(const Array& filters) {
  if (filters.empty()) return;
  _rules.clear();
  _rulesByFoldedKey.clear();
  _shapes.reset();
  _rules.reserve(filters.size());
  for (const Value& element : filters) {
    const Dictionary* rule = element.dictionary();
    _rules.push_back(rule ? compiled(*rule) : filterTag());
    const filterTag& tag = _rules.back();
    const bool hasKey = rule && rule->string("key");
    if (!hasKey) continue;
    const std::string folded = platform::caseFolded(tag.key);
    _rulesByFoldedKey[folded].push_back(_rules.size() - 1);
    _shapes.set(shapeOf(folded, kShapes));
  }
}

void EventFilters::filterEvent(EventFields& event) const {
  if (_rulesByFoldedKey.empty()) return;
  const std::int64_t method = numberUnder("_method", event);
  const std::int64_t status = numberUnder("_status", event);
  event.change([&](EventField& field) {
    const filterTag* rule = ruleFor(field.key, method, status);
    if (!rule) return true;
    if (rule->action == FilterActionSHA256) {
      const auto text = field.string();
      event.setText(field, TallyBackend::convertIntoSHA256(text ? *text : field.description()));
    }
    return rule->action != FilterActionRemove;
  });
}

const filterTag* EventFilters::ruleFor(std::string_view key, std::int64_t method, std::int64_t status) const {
  // Most fields have no rule: no folding for them.
  if (!_shapes[shapeOf(key, kShapes)] && platform::isASCII(key)) return nullptr;
  const auto found = _rulesByFoldedKey.find(platform::caseFolded(key));
  if (found == _rulesByFoldedKey.end()) return nullptr;
  for (const std::size_t index : found->second) {
    const filterTag& rule = _rules[index];
    if (fits(rule.method, method) && fits(rule.status, status)) return &rule;
  }
  return nullptr;
}

}  // namespace tallyd
