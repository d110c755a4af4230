#include <fmt/format.h>

#include <chrono>
#include <cmath>
#include <limits>

#include "platform/UTF8.h"
#include "platform/property-list/LibraryNode.h"
#include "platform/property-list/Limits.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

namespace {

/// Dates that the library's 32-bit seconds can't hold go through its XML reader, which takes years of four
/// digits.
Node distantDate(double secondsSince1970) {
  using namespace std::chrono;
  constexpr sys_days kFirst = std::chrono::year(1) / 1 / 1;
  constexpr sys_days kBehindLast = std::chrono::year(10'000) / 1 / 1;
  const auto asSeconds = [](sys_days day) {
    return static_cast<double>(sys_seconds(day).time_since_epoch().count());
  };
  if (!(secondsSince1970 >= asSeconds(kFirst) && secondsSince1970 < asSeconds(kBehindLast))) return nullptr;
  const sys_seconds whole{seconds(static_cast<std::int64_t>(std::floor(secondsSince1970)))};
  const auto day = floor<days>(whole);
  const year_month_day date(day);
  const hh_mm_ss time(whole - day);
  return nodeFromXML(fmt::format("<date>{:04}-{:02}-{:02}T{:02}:{:02}:{:02}Z</date>",
                                 static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                                 static_cast<unsigned>(date.day()), time.hours().count(),
                                 time.minutes().count(), time.seconds().count()));
}

/// Builds the library's nodes; every operator gives null for what can't be written.
class NodeWriter {
 public:
  explicit NodeWriter(PropertyListFormat format) : _format(format) {}

  Node write(const Value& value) {
    if ((_bytes += kBytesPerReference) > kMaximumPropertyListBytes) return nullptr;
    return value.visit(*this);
  }

  Node operator()(std::monostate) { return nullptr; }
  Node operator()(bool value) { return Node(plist_new_bool(value ? 1 : 0)); }
  Node operator()(std::uint64_t value) { return integerNode(value); }
  Node operator()(std::int64_t value) {
    return value < 0 ? integerNode(value) : Node(plist_new_uint(static_cast<std::uint64_t>(value)));
  }
  Node operator()(double value) { return Node(plist_new_real(value)); }
  Node operator()(std::string_view value) {
    const std::string text = usableText(value);
    if ((_bytes += text.size()) > kMaximumPropertyListBytes) return nullptr;
    return Node(plist_new_string(text.c_str()));
  }
  Node operator()(Date value) {
    constexpr double kMicroseconds = 1e6;
    const double seconds = value.secondsSince1970 - static_cast<double>(kLibraryEpochSeconds);
    double whole = std::floor(seconds);
    // XML has whole seconds.
    double fraction = _format == PropertyListFormat::XML ? 0 : std::round((seconds - whole) * kMicroseconds);
    if (fraction >= kMicroseconds) {
      whole += 1;
      fraction = 0;
    }
    // The reader takes both ends of the range for an overflow.
    if (!(whole > std::numeric_limits<std::int32_t>::min() &&
          whole < std::numeric_limits<std::int32_t>::max() - 1)) {
      return distantDate(value.secondsSince1970);
    }
    return Node(plist_new_date(static_cast<std::int32_t>(whole), static_cast<std::int32_t>(fraction)));
  }
  Node operator()(const Data& value) {
    if ((_bytes += value.size()) > kMaximumPropertyListBytes) return nullptr;
    return Node(plist_new_data(value.bytes().data(), value.size()));
  }
  Node operator()(const Array& array) {
    if (_depth == kMaximumPropertyListDepth) return nullptr;
    ++_depth;
    Node node(plist_new_array());
    for (const Value& element : array) {
      Node child = write(element);
      if (!child) return nullptr;
      plist_array_append_item(node.get(), child.release());
    }
    --_depth;
    return node;
  }
  Node operator()(const Dictionary& dictionary) {
    if (_depth == kMaximumPropertyListDepth) return nullptr;
    ++_depth;
    Node node(plist_new_dict());
    for (const auto& [key, element] : dictionary) {
      Node child = write(element);
      _bytes += key.size();
      if (!child) return nullptr;
      plist_dict_set_item(node.get(), usableText(key).c_str(), child.release());
    }
    --_depth;
    return node;
  }

 private:
  /// What the library and the format can carry: UTF-8 without NUL, in XML without the characters that it
  /// excludes (XML 1.0, section 2.2).
  [[nodiscard]] std::string usableText(std::string_view text) const {
    std::string usable;
    usable.reserve(text.size());
    while (!text.empty()) {
      const UTF8Sequence sequence = firstUTF8Sequence(text);
      const std::string_view character = text.substr(0, sequence.length);
      usable += sequence.wellFormed && isUsable(character) ? character : kReplacementCharacter;
      text.remove_prefix(sequence.length);
    }
    return usable;
  }

  [[nodiscard]] bool isUsable(std::string_view character) const {
    if (character[0] == '\0') return false;
    if (_format == PropertyListFormat::Binary) return true;
    const auto lead = static_cast<unsigned char>(character[0]);
    if (lead < 0x20) return lead == '\t' || lead == '\n' || lead == '\r';
    return character != "\xEF\xBF\xBE" && character != "\xEF\xBF\xBF";
  }

  PropertyListFormat _format;
  int _depth = 0;
  std::size_t _bytes = 0;
};

}  // namespace

std::optional<std::string> dataWithPropertyList(const Value& value, PropertyListFormat format) {
  const Node root = NodeWriter(format).write(value);
  if (!root) return std::nullopt;
  char* bytes = nullptr;  // The library writes only where it finds null.
  std::uint32_t length = 0;
  const bool isXML = format == PropertyListFormat::XML;
  (isXML ? plist_to_xml : plist_to_bin)(root.get(), &bytes, &length);
  const std::unique_ptr<char, void (*)(char*)> owner(bytes, isXML ? plist_to_xml_free : plist_to_bin_free);
  if (!bytes) return std::nullopt;
  return std::string(bytes, length);
}

}  // namespace tallyd::platform
