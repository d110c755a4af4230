// An event's fields on their way into a document.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace tallyd {

/// One field. Whatever it refers to must outlive it.
struct EventField {
  std::string_view key;
  const platform::Value* value = nullptr;  ///< Null when the field is `text`.
  std::string_view text{};
  std::string_view json{};  ///< Key and value as JSON where that is known; else empty.

  [[nodiscard]] std::optional<std::string_view> string() const {
    return value ? value->string() : std::optional(text);
  }
  /// As Value::description().
  [[nodiscard]] std::string description() const { return value ? value->description() : std::string(text); }
  /// As Value::integerValue().
  [[nodiscard]] std::optional<std::int64_t> integer() const {
    return value ? value->integerValue() : platform::leadingInteger(text);
  }
};

/// The fields of one event in the order of their keys: references, so that nothing is copied, and room that
/// is used again for the next event.
///
/// Threading: one thread at a time.
class EventFields {
 public:
  EventFields() { _fields.reserve(kUsualSize); }
  explicit EventFields(const platform::Dictionary& event) : EventFields() { merge(event); }
  EventFields(const EventFields&) = delete;
  EventFields& operator=(const EventFields&) = delete;

  void clear();
  /// The key must come after all that are here.
  void append(const EventField& field) { _fields.push_back(field); }
  /// Sets every entry here, over fields with the same keys.
  void merge(const platform::Dictionary& entries);
  /// Calls `change` with every field, which may give it another value or text; removes the field when
  /// `change` returns false.
  template <class Change>
  void change(Change&& change) {
    auto kept = _fields.begin();
    for (EventField& field : _fields) {
      if (!change(field)) continue;
      if (&*kept != &field) *kept = field;
      ++kept;
    }
    _fields.erase(kept, _fields.end());
  }
  /// Makes the field this text, which is kept until clear().
  void setText(EventField& field, std::string text) {
    field = {.key = field.key, .text = keep(std::move(text))};
  }
  /// A text that lives until clear().
  std::string_view keep(std::string text) { return _texts.emplace_back(std::move(text)); }

  [[nodiscard]] std::vector<EventField>::const_iterator begin() const { return _fields.begin(); }
  [[nodiscard]] std::vector<EventField>::const_iterator end() const { return _fields.end(); }
  [[nodiscard]] std::size_t size() const { return _fields.size(); }
  [[nodiscard]] const EventField* find(std::string_view key) const;
  [[nodiscard]] platform::Dictionary dictionary() const;

 private:
  static constexpr std::size_t kUsualSize = 40;

  std::vector<EventField> _fields;
  std::vector<EventField> _merged;  ///< Room for merge().
  std::deque<std::string> _texts;   ///< Stay where they are when more come.
};

}  // namespace tallyd
