#include "platform/power-log/PowerLogLine.h"

#include <fmt/format.h>

#include <cmath>

#include "platform/Base64.h"
#include "platform/JSON.h"

namespace tallyd::platform {

namespace {

/// Makes a copy of a value that has nothing in it that JSON can't take.
class JSONForm {
 public:
  Value of(const Value& value) { return value.visit(*this); }

  Value operator()(std::monostate) { return {}; }
  Value operator()(bool value) { return value; }
  Value operator()(std::int64_t value) { return value; }
  Value operator()(std::uint64_t value) { return value; }
  Value operator()(double value) { return std::isfinite(value) ? Value(value) : Value(); }
  Value operator()(std::string_view value) { return value; }
  Value operator()(Date value) { return (*this)(value.secondsSince1970); }
  Value operator()(const Data& value) { return base64Encoded(value.bytes()); }
  Value operator()(const Array& array) {
    if (_depth == kMaximumValueDepth) return {};
    ++_depth;
    std::vector<Value> elements;
    elements.reserve(array.size());
    for (const Value& element : array) elements.push_back(of(element));
    --_depth;
    return Array(std::move(elements));
  }
  Value operator()(const Dictionary& dictionary) {
    if (_depth == kMaximumValueDepth) return {};
    ++_depth;
    std::vector<Dictionary::Entry> entries;
    entries.reserve(dictionary.size());
    for (const auto& [key, element] : dictionary) entries.push_back({key, of(element)});
    --_depth;
    return Dictionary(std::move(entries));
  }

 private:
  int _depth = 1;  // The line's own object.
};

std::string jsonText(const Value& value) { return jsonFromValue(JSONForm().of(value)).value_or("null"); }

}  // namespace

std::string powerLogLine(TimePoint time, std::int32_t number, std::string_view name,
                         const Dictionary& record) {
  return fmt::format("{{\"time\": {:.6f}, \"number\": {}, \"name\": {}, \"record\": {}}}\n",
                     secondsSince1970(time), number, jsonText(name), jsonText(record));
}

}  // namespace tallyd::platform
