#include "platform/Value.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cmath>
#include <limits>

namespace tallyd::platform {

namespace {

/// `text` behind its leading blanks and one plus sign, as the standard's number readers want it.
std::string_view numberStart(std::string_view text) {
  const auto first = text.find_first_not_of(" \t\n\r\v\f");
  if (first == std::string_view::npos) return {};
  text.remove_prefix(first);
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  return text;
}

double leadingReal(std::string_view text) {
  text = numberStart(text);
  // from_chars also reads "inf" and "nan", which are no decimal numbers.
  const auto digit = text.find_first_of("0123456789");
  if (digit > 2) return 0;  // None at all is npos, the largest number.
  double number = 0;
  std::from_chars(text.data(), text.data() + text.size(), number);
  return number;
}

std::int64_t integerFromReal(double number) {
  if (std::isnan(number)) return 0;
  // 2^63 is the first double that does not fit.
  constexpr double kLimit = 9223372036854775808.0;
  if (number >= kLimit) return std::numeric_limits<std::int64_t>::max();
  if (number < -kLimit) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(number);
}

bool truthOfText(std::string_view text) {
  text = numberStart(text);
  if (text.empty()) return false;
  if (std::string_view("YyTt").find(text[0]) != std::string_view::npos) return true;
  return leadingInteger(text) != 0;
}

/// A number in the shortest text that reads back as the same number.
std::string textOfReal(double number) { return fmt::format("{}", number); }

std::string dateText(double seconds) {
  using namespace std::chrono;
  constexpr double kLargestPlausible = 1e14;  // Beyond some three million years the calendar is of no use.
  if (!(std::abs(seconds) < kLargestPlausible)) return textOfReal(seconds);
  const auto whole = sys_seconds(std::chrono::seconds(static_cast<std::int64_t>(std::floor(seconds))));
  const auto day = floor<days>(whole);
  const year_month_day date(day);
  const hh_mm_ss time(whole - day);
  return fmt::format("{:04}-{:02}-{:02} {:02}:{:02}:{:02} +0000", static_cast<int>(date.year()),
                     static_cast<unsigned>(date.month()), static_cast<unsigned>(date.day()),
                     time.hours().count(), time.minutes().count(), time.seconds().count());
}

struct Describer {
  std::string& text;

  void operator()(std::monostate) const { text += "(null)"; }
  void operator()(bool value) const { text += value ? '1' : '0'; }
  void operator()(std::int64_t value) const { fmt::format_to(std::back_inserter(text), "{}", value); }
  void operator()(std::uint64_t value) const { fmt::format_to(std::back_inserter(text), "{}", value); }
  void operator()(double value) const { text += textOfReal(value); }
  void operator()(std::string_view value) const { text += value; }
  void operator()(Date value) const { text += dateText(value.secondsSince1970); }
  void operator()(const Data& value) const {
    text += '<';
    for (const char byte : value.bytes()) {
      fmt::format_to(std::back_inserter(text), "{:02x}", static_cast<unsigned char>(byte));
    }
    text += '>';
  }
  void operator()(const Array& value) const {
    text += '(';
    bool first = true;
    for (const Value& element : value) {
      if (!std::exchange(first, false)) text += ", ";
      element.visit(*this);
    }
    text += ')';
  }
  void operator()(const Dictionary& value) const {
    text += '{';
    for (const auto& [key, element] : value) {
      text += key;
      text += " = ";
      element.visit(*this);
      text += "; ";
    }
    text += '}';
  }
};

}  // namespace

std::int64_t leadingInteger(std::string_view text) {
  text = numberStart(text);
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc::result_out_of_range) return number;
  return text[0] == '-' ? std::numeric_limits<std::int64_t>::min() : std::numeric_limits<std::int64_t>::max();
}

// Array

Array::Array(std::initializer_list<Value> elements) : Array(std::vector<Value>(elements)) {}
Array::Array(std::vector<Value> elements) : _elements(std::move(elements)) {}

void Array::append(Value value) { _elements.unique().push_back(std::move(value)); }
void Array::replace(std::size_t index, Value value) { _elements.unique()[index] = std::move(value); }
bool Array::operator==(const Array& other) const {
  return std::equal(begin(), end(), other.begin(), other.end());
}

// Dictionary

namespace {

constexpr auto kByKey = [](const Dictionary::Entry& entry, std::string_view key) { return entry.key < key; };

constexpr auto kInOrder = [](const Dictionary::Entry& a, const Dictionary::Entry& b) {
  return a.key < b.key;
};

/// Small ones are sorted where they lie: the library's stable sort asks for memory.
void sortByKey(std::vector<Dictionary::Entry>& entries) {
  constexpr std::size_t kSmall = 32;
  if (entries.size() > kSmall) return std::stable_sort(entries.begin(), entries.end(), kInOrder);
  for (auto next = entries.begin(); next != entries.end(); ++next) {
    std::rotate(std::upper_bound(entries.begin(), next, *next, kInOrder), next, std::next(next));
  }
}

std::vector<Dictionary::Entry> sortedEntries(std::vector<Dictionary::Entry> entries) {
  const auto isOutOfOrder = [](const auto& a, const auto& b) { return a.key >= b.key; };
  if (std::adjacent_find(entries.begin(), entries.end(), isOutOfOrder) == entries.end()) return entries;
  sortByKey(entries);
  // Of equal keys the last given stays: walking backwards, it is the first met.
  const auto kept = std::unique(entries.rbegin(), entries.rend(),
                                [](const auto& a, const auto& b) { return a.key == b.key; });
  entries.erase(entries.begin(), kept.base());
  return entries;
}

}  // namespace

Dictionary::Dictionary(std::initializer_list<Entry> entries) : Dictionary(std::vector<Entry>(entries)) {}
Dictionary::Dictionary(std::vector<Entry> entries) : _entries(sortedEntries(std::move(entries))) {}

const Value* Dictionary::find(std::string_view key) const {
  const Entry* found = std::lower_bound(begin(), end(), key, kByKey);
  return found != end() && found->key == key ? &found->value : nullptr;
}

std::optional<std::string_view> Dictionary::string(std::string_view key) const {
  const Value* value = find(key);
  return value ? value->string() : std::nullopt;
}
std::optional<std::int64_t> Dictionary::integer(std::string_view key) const {
  const Value* value = find(key);
  return value ? value->integerValue() : std::nullopt;
}
std::optional<double> Dictionary::real(std::string_view key) const {
  const Value* value = find(key);
  return value ? value->realValue() : std::nullopt;
}
bool Dictionary::boolean(std::string_view key) const {
  const Value* value = find(key);
  return value && value->booleanValue();
}
const Array* Dictionary::array(std::string_view key) const {
  const Value* value = find(key);
  return value ? value->array() : nullptr;
}
const Dictionary* Dictionary::dictionary(std::string_view key) const {
  const Value* value = find(key);
  return value ? value->dictionary() : nullptr;
}

void Dictionary::set(std::string_view key, Value value) {
  auto& all = _entries.unique();
  const auto place = std::lower_bound(all.begin(), all.end(), key, kByKey);
  if (place != all.end() && place->key == key) {
    place->value = std::move(value);
  } else {
    all.insert(place, Entry{std::string(key), std::move(value)});
  }
}

void Dictionary::remove(std::string_view key) {
  if (!contains(key)) return;
  auto& all = _entries.unique();
  all.erase(std::lower_bound(all.begin(), all.end(), key, kByKey));
}

namespace {

/// `mine` with the entries from `theirs` on set over it; both in the order of their keys.
template <class Theirs>
std::vector<Dictionary::Entry> mergedEntries(const Dictionary& mine, Theirs theirs, Theirs end) {
  std::vector<Dictionary::Entry> merged;
  merged.reserve(mine.size() + static_cast<std::size_t>(end - theirs));
  const Dictionary::Entry* next = mine.begin();
  for (; theirs != end; ++theirs) {
    const std::string& key = (*theirs).key;
    while (next != mine.end() && next->key < key) merged.push_back(*next++);
    if (next != mine.end() && next->key == key) ++next;
    merged.push_back(*theirs);
  }
  merged.insert(merged.end(), next, mine.end());
  return merged;
}

}  // namespace

void Dictionary::merge(const Dictionary& other) {
  if (!other.empty()) merge(Dictionary(other));
}

void Dictionary::merge(Dictionary&& other) {
  if (other.empty()) return;
  if (empty()) {
    *this = std::move(other);
    return;
  }
  if (!other._entries.isShared()) {
    auto& theirs = other._entries.unique();
    _entries = Shared(
        mergedEntries(*this, std::make_move_iterator(theirs.begin()), std::make_move_iterator(theirs.end())));
  } else {
    const auto& theirs = *other._entries;
    _entries = Shared(mergedEntries(*this, theirs.begin(), theirs.end()));
  }
}

bool Dictionary::operator==(const Dictionary& other) const {
  return std::equal(begin(), end(), other.begin(), other.end());
}

// Value

Value::Value(std::uint64_t value) {
  if (value <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
    _value = static_cast<std::int64_t>(value);
  } else {
    _value = value;
  }
}

std::optional<std::string_view> Value::string() const {
  const auto* text = std::get_if<SharedText>(&_value);
  return text ? std::optional(text->view()) : std::nullopt;
}

std::optional<Date> Value::date() const {
  const auto* date = std::get_if<Date>(&_value);
  return date ? std::optional(*date) : std::nullopt;
}

std::optional<std::int64_t> Value::integerValue() const {
  if (const auto* number = std::get_if<std::int64_t>(&_value)) return *number;
  if (const auto* number = std::get_if<std::uint64_t>(&_value)) return static_cast<std::int64_t>(*number);
  if (const auto* number = std::get_if<double>(&_value)) return integerFromReal(*number);
  if (const auto* truth = std::get_if<bool>(&_value)) return *truth ? 1 : 0;
  if (const auto text = string()) return leadingInteger(*text);
  return std::nullopt;
}

std::optional<double> Value::realValue() const {
  if (const auto* number = std::get_if<double>(&_value)) return *number;
  if (const auto* number = std::get_if<std::uint64_t>(&_value)) return static_cast<double>(*number);
  if (const auto text = string()) return leadingReal(*text);
  if (const auto number = integerValue()) return static_cast<double>(*number);
  return std::nullopt;
}

bool Value::booleanValue() const {
  if (const auto text = string()) return truthOfText(*text);
  if (const auto* number = std::get_if<double>(&_value)) return *number != 0;
  return integerValue().value_or(0) != 0;
}

std::string Value::description() const {
  std::string text;
  visit(Describer{text});
  return text;
}

bool Value::operator==(const Value& other) const {
  if (_value.index() != other._value.index()) return false;
  return std::visit(
      [&other](const auto& mine) {
        using Kind = std::decay_t<decltype(mine)>;
        return mine == std::get<Kind>(other._value);
      },
      _value);
}

}  // namespace tallyd::platform
