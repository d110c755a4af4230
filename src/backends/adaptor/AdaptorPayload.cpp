#include "backends/adaptor/AdaptorPayload.h"

#include <vector>

#include "platform/property-list/PropertyList.h"

namespace tallyd {

using platform::Array;
using platform::Date;
using platform::Dictionary;
using platform::LogLevel;
using platform::PropertyListFormat;
using platform::Value;

namespace {

std::optional<std::string> binaryList(const Value& value) {
  return dataWithPropertyList(value, PropertyListFormat::Binary);
}

/// Copies a value without what a property list can't hold, and counts that.
class ListForm {
 public:
  /// Nothing when it is the value itself that can't be held.
  std::optional<Value> of(const Value& value) { return value.visit(*this); }
  [[nodiscard]] std::size_t dropped() const { return _dropped; }

  std::optional<Value> operator()(std::monostate) { return drop(); }
  std::optional<Value> operator()(Date date) {
    return binaryList(date) ? std::optional<Value>(date) : drop();
  }
  template <class Plain>
  std::optional<Value> operator()(const Plain& plain) {
    return Value(plain);
  }
  std::optional<Value> operator()(const Array& array) {
    if (_depth == platform::kMaximumPropertyListDepth) return drop();
    ++_depth;
    std::vector<Value> elements;
    for (const Value& element : array) {
      if (auto kept = of(element)) elements.push_back(std::move(*kept));
    }
    --_depth;
    return Array(std::move(elements));
  }
  std::optional<Value> operator()(const Dictionary& dictionary) {
    if (_depth == platform::kMaximumPropertyListDepth) return drop();
    ++_depth;
    std::vector<Dictionary::Entry> entries;
    for (const auto& [key, element] : dictionary) {
      if (auto kept = of(element)) entries.push_back({key, std::move(*kept)});
    }
    --_depth;
    return Dictionary(std::move(entries));
  }

 private:
  std::nullopt_t drop() {
    ++_dropped;
    return std::nullopt;
  }

  int _depth = 0;
  std::size_t _dropped = 0;
};

}  // namespace

std::optional<std::string> adaptorPayload(const Dictionary& payload, platform::Log& log) {
  auto list = binaryList(payload);
  if (list) return list;
  ListForm form;
  if (const auto kept = form.of(payload)) list = binaryList(*kept);
  if (!list) {
    asl_log(log, LogLevel::Error, "PithBackend(sendMessage): Dropping a message with too large a payload");
    return std::nullopt;
  }
  asl_log(log, LogLevel::Warning,
          "PithBackend(sendMessage): Dropping {} value(s) of the payload that a property list can't hold",
          form.dropped());
  return list;
}

}  // namespace tallyd
