// The storebag's filter rules, compiled: which fields of an event are removed or hashed.
#pragma once

#include <bitset>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "backends/https-post/EventFields.h"
#include "platform/Value.h"

namespace tallyd {

enum FilterAction : std::int32_t {
  FilterActionNone = 0,
  FilterActionRemove = 1,
  FilterActionSHA256 = 2,
};

/// One compiled rule.
struct filterTag {
  static constexpr std::int32_t kAny = -1;

  std::int32_t method = kAny;  ///< The message's category that it is for; any when negative.
  std::int32_t status = kAny;  ///< The message's type that it is for; any when negative.
  std::int32_t action = FilterActionNone;
  std::string key;
};

/// Rules in the order of the storebag; only the first that fits a field counts.
///
/// Threading: one thread at a time.
class EventFilters {
 public:
  /// Replaces the rules; an empty array leaves the earlier ones in place. An element that is no dictionary,
  /// or has no key, fits no field.
  void createFiltersFromArray(const platform::Array& filters);

  /// Applies the rules to every field of the event, whose "_method" and "_status" choose among them.
  void filterEvent(EventFields& event) const;

  [[nodiscard]] const std::vector<filterTag>& rules() const { return _rules; }

 private:
  [[nodiscard]] const filterTag* ruleFor(std::string_view key, std::int64_t method,
                                         std::int64_t status) const;

  std::vector<filterTag> _rules;
  /// Indices into `_rules` by their case-folded key, in the order of the storebag: a field's cost does not
  /// grow with the number of rules for other fields.
  std::unordered_map<std::string, std::vector<std::size_t>> _rulesByFoldedKey;
  static constexpr std::size_t kShapes = 256;
  std::bitset<kShapes> _shapes;  ///< Of the folded keys.
};

}  // namespace tallyd
