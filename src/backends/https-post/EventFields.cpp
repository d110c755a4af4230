#include "backends/https-post/EventFields.h"

#include <algorithm>

namespace tallyd {

using platform::Dictionary;
using platform::Value;

void EventFields::clear() {
  _fields.clear();
  _texts.clear();
}

void EventFields::merge(const Dictionary& entries) {
  _merged.clear();
  auto next = _fields.cbegin();
  for (const auto& [key, value] : entries) {
    while (next != _fields.cend() && next->key < key) _merged.push_back(*next++);
    if (next != _fields.cend() && next->key == key) ++next;
    _merged.push_back({.key = key, .value = &value});
  }
  _merged.insert(_merged.end(), next, _fields.cend());
  _fields.swap(_merged);
}

const EventField* EventFields::find(std::string_view key) const {
  const auto found =
      std::lower_bound(begin(), end(), key,
                       [](const EventField& field, std::string_view wanted) { return field.key < wanted; });
  return found != end() && found->key == key ? &*found : nullptr;
}

Dictionary EventFields::dictionary() const {
  std::vector<Dictionary::Entry> entries;
  entries.reserve(_fields.size());
  for (const EventField& field : _fields) {
    entries.push_back({std::string(field.key), field.value ? *field.value : Value(field.text)});
  }
  return Dictionary(std::move(entries));
}

}  // namespace tallyd
