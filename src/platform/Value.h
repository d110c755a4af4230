// Property-list values: what clients, storebags, preferences and records are made of.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/Shared.h"

namespace tallyd::platform {

class Value;

/// Deepest nesting of containers in values that come from or go to bytes of any form; an empty array has
/// depth 1. Bounds the recursion of everything that walks values.
inline constexpr int kMaximumValueDepth = 128;

/// A point in time.
struct Date {
  double secondsSince1970 = 0;  ///< May carry fractions; negative before 1970.
  bool operator==(const Date&) const = default;
};

/// Immutable bytes, shared between copies.
class Data {
 public:
  Data() = default;
  explicit Data(std::string bytes) : _bytes(std::move(bytes)) {}

  [[nodiscard]] std::string_view bytes() const {
    return _bytes ? std::string_view(*_bytes) : std::string_view();
  }
  [[nodiscard]] std::size_t size() const { return _bytes ? _bytes->size() : 0; }
  [[nodiscard]] bool empty() const { return size() == 0; }
  bool operator==(const Data& other) const { return bytes() == other.bytes(); }

 private:
  Shared<std::string> _bytes;
};

/// Ordered values. Copies share their elements; a copy that is changed copies only its own top level.
class Array {
 public:
  Array() = default;
  Array(std::initializer_list<Value> elements);
  explicit Array(std::vector<Value> elements);

  [[nodiscard]] std::size_t size() const;
  [[nodiscard]] bool empty() const { return size() == 0; }
  [[nodiscard]] const Value& operator[](std::size_t index) const;  ///< `index` must be below size().
  [[nodiscard]] const Value* begin() const;
  [[nodiscard]] const Value* end() const;

  void append(Value value);
  void replace(std::size_t index, Value value);  ///< `index` must be below size().
  bool operator==(const Array& other) const;

 private:
  Shared<std::vector<Value>> _elements;
};

/// String keys to values. Copies share their entries; a copy that is changed copies only its own top level.
///
/// Entries are kept in the byte order of their keys, which is also the order of enumeration: look-up is
/// logarithmic and enumeration deterministic.
class Dictionary {
 public:
  struct Entry;

  Dictionary() = default;
  Dictionary(std::initializer_list<Entry> entries);
  /// Takes entries in any order; of entries with one key the last stays.
  explicit Dictionary(std::vector<Entry> entries);

  [[nodiscard]] std::size_t size() const;
  [[nodiscard]] bool empty() const { return size() == 0; }
  /// The value under `key`, or null. Valid until this dictionary is changed or destroyed.
  [[nodiscard]] const Value* find(std::string_view key) const;
  [[nodiscard]] bool contains(std::string_view key) const { return find(key) != nullptr; }
  [[nodiscard]] const Entry* begin() const;
  [[nodiscard]] const Entry* end() const;

  /// Typed look-ups, as Value's own: nothing when the key is missing or its value is of another kind.
  [[nodiscard]] std::optional<std::string_view> string(std::string_view key) const;
  [[nodiscard]] std::optional<std::int64_t> integer(std::string_view key) const;
  [[nodiscard]] std::optional<double> real(std::string_view key) const;
  [[nodiscard]] bool boolean(std::string_view key) const;  ///< False when missing.
  [[nodiscard]] const Array* array(std::string_view key) const;
  [[nodiscard]] const Dictionary* dictionary(std::string_view key) const;

  void set(std::string_view key, Value value);
  void remove(std::string_view key);
  /// Sets every entry of `other` here, over entries with the same keys.
  void merge(const Dictionary& other);
  void merge(Dictionary&& other);
  bool operator==(const Dictionary& other) const;

 private:
  Shared<std::vector<Entry>> _entries;
};

/// One property-list value: null, boolean, integer, real, string, date, data, array or dictionary.
///
/// Copying is cheap (at most one reference count). Values that are shared are never changed, so copies may be
/// used on any number of threads; one Value object belongs to one thread at a time.
class Value {
 public:
  Value() = default;  ///< Null.
  Value(std::nullptr_t) {}
  Value(bool value) : _value(value) {}
  Value(int value) : _value(std::int64_t{value}) {}
  Value(unsigned value) : _value(std::int64_t{value}) {}
  Value(std::int64_t value) : _value(value) {}
  Value(std::uint64_t value);  ///< Becomes a signed integer when it fits.
  Value(long long value) : _value(static_cast<std::int64_t>(value)) {}
  Value(double value) : _value(value) {}
  Value(const char* value) : Value(std::string_view(value)) {}
  Value(std::string_view value) : _value(SharedText(value)) {}
  Value(const std::string& value) : Value(std::string_view(value)) {}
  Value(Date value) : _value(value) {}
  Value(Data value) : _value(std::move(value)) {}
  Value(Array value) : _value(std::move(value)) {}
  Value(Dictionary value) : _value(std::move(value)) {}

  [[nodiscard]] bool isNull() const { return std::holds_alternative<std::monostate>(_value); }
  [[nodiscard]] bool isString() const { return std::holds_alternative<SharedText>(_value); }
  [[nodiscard]] bool isBoolean() const { return std::holds_alternative<bool>(_value); }
  [[nodiscard]] bool isInteger() const {
    return std::holds_alternative<std::int64_t>(_value) || std::holds_alternative<std::uint64_t>(_value);
  }
  [[nodiscard]] bool isReal() const { return std::holds_alternative<double>(_value); }
  /// Integer, real or boolean.
  [[nodiscard]] bool isNumber() const { return isInteger() || isReal() || isBoolean(); }

  /// The value when it is of just this kind, else nothing.
  [[nodiscard]] std::optional<std::string_view> string() const;
  [[nodiscard]] std::optional<Date> date() const;
  [[nodiscard]] const Data* data() const { return std::get_if<Data>(&_value); }
  [[nodiscard]] const Array* array() const { return std::get_if<Array>(&_value); }
  [[nodiscard]] const Dictionary* dictionary() const { return std::get_if<Dictionary>(&_value); }

  /// The number that this value is or reads as: reals are cut toward zero and clamped; a string gives its
  /// leading decimal number (blanks before it passed over), 0 when it has none; unsigned values above the
  /// signed range keep their 64 bits. Nothing for every other kind.
  [[nodiscard]] std::optional<std::int64_t> integerValue() const;
  /// The same as a real number.
  [[nodiscard]] std::optional<double> realValue() const;
  /// True for true, for a number other than zero, and for a string that starts with Y, y, T, t or a number
  /// other than zero; false for everything else.
  [[nodiscard]] bool booleanValue() const;

  /// Readable text, as the log shows it: strings and numbers bare (booleans "1" and "0"), dates in UTC, data
  /// in hexadecimal between angle brackets, arrays as "(a, b)", dictionaries as "{k = v; }", null as
  /// "(null)".
  [[nodiscard]] std::string description() const;

  /// Calls `visitor` with one of: std::monostate, bool, std::int64_t, std::uint64_t, double,
  /// std::string_view, Date, const Data&, const Array&, const Dictionary&.
  template <class Visitor>
  decltype(auto) visit(Visitor&& visitor) const {
    return std::visit(
        [&visitor](const auto& value) -> decltype(auto) {
          if constexpr (std::is_same_v<std::decay_t<decltype(value)>, SharedText>) {
            return visitor(value.view());
          } else {
            return visitor(value);
          }
        },
        _value);
  }

  bool operator==(const Value& other) const;

 private:
  std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Date, SharedText, Data, Array,
               Dictionary>
      _value;
};

struct Dictionary::Entry {
  std::string key;
  Value value;
  bool operator==(const Entry&) const = default;
};

inline std::size_t Array::size() const { return _elements ? _elements->size() : 0; }
inline const Value& Array::operator[](std::size_t index) const { return (*_elements)[index]; }
inline const Value* Array::begin() const { return _elements ? _elements->data() : nullptr; }
inline const Value* Array::end() const { return begin() + size(); }

inline std::size_t Dictionary::size() const { return _entries ? _entries->size() : 0; }
inline const Dictionary::Entry* Dictionary::begin() const { return _entries ? _entries->data() : nullptr; }
inline const Dictionary::Entry* Dictionary::end() const { return begin() + size(); }

/// The decimal number at the start of `text`, blanks before it passed over; 0 without one; clamped to 64
/// bits.
std::int64_t leadingInteger(std::string_view text);

}  // namespace tallyd::platform
