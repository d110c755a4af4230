#include "platform/property-list/XMLScalar.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <limits>
#include <utility>

#include "platform/Base64.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

constexpr std::array<std::pair<std::string_view, XMLElement>, 11> kElements = {{
    {"plist", XMLElement::List},
    {"dict", XMLElement::Dictionary},
    {"array", XMLElement::Array},
    {"key", XMLElement::Key},
    {"string", XMLElement::String},
    {"integer", XMLElement::Integer},
    {"real", XMLElement::Real},
    {"true", XMLElement::True},
    {"false", XMLElement::False},
    {"date", XMLElement::Date},
    {"data", XMLElement::Data},
}};

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

/// The number that all of `text` is.
template <class Number, class... Base>
std::optional<Number> wholeNumber(std::string_view text, Base... base) {
  Number number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base...);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<Value> integer(std::string_view text) {
  const bool isNegative = text.starts_with('-');
  if (isNegative || text.starts_with('+')) text.remove_prefix(1);
  const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
  if (isHexadecimal) text.remove_prefix(2);
  const auto magnitude = wholeNumber<std::uint64_t>(text, isHexadecimal ? 16 : 10);
  if (!magnitude) return std::nullopt;
  if (!isNegative) return Value(*magnitude);
  constexpr std::uint64_t kLargest = std::uint64_t{1} << 63;
  if (*magnitude > kLargest) return std::nullopt;
  return Value(static_cast<std::int64_t>(~*magnitude + 1));
}

std::optional<Value> real(std::string_view text) {
  if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
  const auto number = wholeNumber<double>(text);
  return number ? std::optional<Value>(*number) : std::nullopt;
}

/// Takes what stands before `separator` from the front of `text`; nothing unless it is a number without a
/// sign.
template <class Number>
std::optional<Number> takeNumber(std::string_view& text, char separator) {
  const std::string_view digits = text.substr(0, text.find(separator));
  const bool isUnsigned =
      digits.size() < text.size() && digits.find_first_not_of("0123456789.") == digits.npos;
  const auto number = isUnsigned ? wholeNumber<Number>(digits) : std::nullopt;
  if (number) text.remove_prefix(digits.size() + 1);
  return number;
}

std::optional<Value> date(std::string_view text) {
  using namespace std::chrono;
  const auto writtenYear = takeNumber<int>(text, '-');
  const auto writtenMonth = takeNumber<unsigned>(text, '-');
  const auto writtenDay = takeNumber<unsigned>(text, 'T');
  const auto hour = takeNumber<int>(text, ':');
  const auto minute = takeNumber<int>(text, ':');
  const auto second = takeNumber<double>(text, 'Z');
  if (!writtenYear || !writtenMonth || !writtenDay || !hour || !minute || !second || !text.empty())
    return std::nullopt;
  const year_month_day day{year(*writtenYear), month(*writtenMonth), std::chrono::day(*writtenDay)};
  // 60 is a leap second.
  if (*writtenYear > 9999 || !day.ok() || *hour > 23 || *minute > 59 || !(*second < 61)) return std::nullopt;
  const auto whole = sys_seconds(sys_days(day)) + hours(*hour) + minutes(*minute);
  return Value(Date{static_cast<double>(whole.time_since_epoch().count()) + *second});
}

}  // namespace

XMLElement xmlElementNamed(std::string_view name) {
  const auto* found =
      std::find_if(kElements.begin(), kElements.end(), [name](const auto& e) { return e.first == name; });
  return found == kElements.end() ? XMLElement::None : found->second;
}

std::optional<Value> xmlScalar(XMLElement element, std::string text) {
  switch (element) {
    case XMLElement::String:
      return Value(std::move(text));
    case XMLElement::Integer:
      return integer(trimmed(text));
    case XMLElement::Real:
      return real(trimmed(text));
    case XMLElement::Date:
      return date(trimmed(text));
    case XMLElement::True:
    case XMLElement::False:
      return trimmed(text).empty() ? std::optional<Value>(element == XMLElement::True) : std::nullopt;
    case XMLElement::Data: {
      auto bytes = base64DecodedIgnoringUnknown(text);
      return bytes ? std::optional<Value>(Data(std::move(*bytes))) : std::nullopt;
    }
    default:
      return std::nullopt;
  }
}

}  // namespace tallyd::platform
