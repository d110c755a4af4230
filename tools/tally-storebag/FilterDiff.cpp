// Filter rules compared by what they do to each field.

#include <fmt/format.h>

#include <algorithm>
#include <set>

#include "backends/TallyBackend.h"
#include "backends/https-post/EventFilters.h"
#include "platform/text/UnicodeText.h"
#include "tally-storebag/BagDiff.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;

namespace {

/// How a field leaves, the less veiled the greater.
enum class Fate { Removed, Hashed, Plain };

constexpr std::string_view nameOf(Fate fate) {
  switch (fate) {
    case Fate::Removed:
      return "removed";
    case Fate::Hashed:
      return "hashed";
    case Fate::Plain:
      return "plain";
  }
  return "";
}

/// The codes that the rules name, and one that they don't.
class Codes {
 public:
  void add(std::int32_t code) {
    if (code >= 0) _named.insert(code);
  }
  [[nodiscard]] std::vector<std::int32_t> all() const {
    std::vector<std::int32_t> codes(_named.begin(), _named.end());
    codes.push_back(other());
    return codes;
  }
  [[nodiscard]] std::string shown(std::int32_t code) const {
    return code == other() ? std::string("any other") : std::to_string(code);
  }

 private:
  [[nodiscard]] std::int32_t other() const {
    std::int32_t code = 0;
    while (_named.contains(code)) ++code;
    return code;
  }
  std::set<std::int32_t> _named;
};

struct Case {
  std::int32_t method;
  std::int32_t status;
};

Fate fateOf(const std::string& key, const Case& message, const EventFilters& filters) {
  constexpr std::string_view kProbe = "?";
  Dictionary event{{"_method", std::to_string(message.method)}, {"_status", std::to_string(message.status)}};
  if (!event.contains(key)) event.set(key, kProbe);
  const std::string before(*event.string(key));
  EventFields fields(event);
  filters.filterEvent(fields);
  const EventField* left = fields.find(key);
  if (!left) return Fate::Removed;
  return left->string() == TallyBackend::convertIntoSHA256(before) ? Fate::Hashed : Fate::Plain;
}

class FieldDiff {
 public:
  FieldDiff(const EventFilters& before, const EventFilters& after, const std::string& path, Changes& changes)
      : _before(before), _after(after), _path(path), _changes(changes) {
    for (const EventFilters* filters : {&before, &after}) {
      for (const filterTag& rule : filters->rules()) {
        _methods.add(rule.method);
        _statuses.add(rule.status);
        if (!rule.key.empty()) _fields.insert(platform::caseFolded(rule.key));
      }
    }
  }

  void run() {
    for (const std::string& field : _fields) diffField(field);
  }

 private:
  struct Found {
    Case message;
    Fate before;
    Fate after;
    [[nodiscard]] bool sameFate(const Found& other) const {
      return before == other.before && after == other.after;
    }
  };

  void diffField(const std::string& field) {
    std::vector<Found> found;
    for (const std::int32_t method : _methods.all()) {
      for (const std::int32_t status : _statuses.all()) {
        const Case message{method, status};
        found.push_back({message, fateOf(field, message, _before), fateOf(field, message, _after)});
      }
    }
    const bool isOne =
        std::ranges::all_of(found, [&](const Found& one) { return one.sameFate(found.front()); });
    if (isOne) return report(field, found.front(), "");
    for (const Found& one : found) {
      report(field, one,
             fmt::format(", method {}, status {}", _methods.shown(one.message.method),
                         _statuses.shown(one.message.status)));
    }
  }

  void report(const std::string& field, const Found& found, const std::string& when) {
    if (found.before == found.after) return;
    const bool grows = found.after > found.before;
    _changes.push_back(
        {grows ? Exposure::Grows : Exposure::Shrinks, _path,
         fmt::format("field \"{}\"{}: {} -> {}", field, when, nameOf(found.before), nameOf(found.after))});
  }

  const EventFilters& _before;
  const EventFilters& _after;
  const std::string& _path;
  Changes& _changes;
  Codes _methods;
  Codes _statuses;
  std::set<std::string> _fields;
};

}  // namespace

void diffFilters(const Array& before, const Array& after, const std::string& path, Changes& changes) {
  EventFilters old;
  old.createFiltersFromArray(before);
  EventFilters now;
  now.createFiltersFromArray(after);
  FieldDiff(old, now, path, changes).run();
}

}  // namespace tallyd::storebagtool
