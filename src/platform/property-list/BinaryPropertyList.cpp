#include "platform/property-list/BinaryPropertyList.h"

#include <cstdlib>
#include <limits>
#include <vector>

#include "platform/UTF8.h"
#include "platform/property-list/BinaryWalk.h"
#include "platform/property-list/LibraryNode.h"
#include "platform/property-list/XMLPropertyList.h"

namespace tallyd::platform {

namespace {

struct CDeleter {
  void operator()(void* memory) const { std::free(memory); }
};
struct XMLDeleter {
  void operator()(char* text) const { plist_to_xml_free(text); }
};

/// The library hands out 64 bits without saying whether they stand for a negative number, but nodes of the
/// one kind and of the other differ when it compares them.
Value integer(plist_t node) {
  std::uint64_t bits = 0;
  plist_get_uint_val(node, &bits);
  if (bits > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
    const Node asUnsigned = integerNode(bits);
    if (!plist_compare_node_value(node, asUnsigned.get())) return {static_cast<std::int64_t>(bits)};
  }
  return {bits};
}

/// A date that the library's 32-bit seconds can't hold, taken from its XML, which has whole seconds.
std::optional<Date> distantDate(plist_t node) {
  const Node alone(plist_copy(node));
  char* xml = nullptr;
  std::uint32_t length = 0;
  plist_to_xml(alone.get(), &xml, &length);
  const std::unique_ptr<char, XMLDeleter> owner(xml);
  const auto value = propertyListWithXML({xml ? xml : "", length}).value;
  return value ? value->date() : std::nullopt;
}

/// The library cuts dates to microseconds and drops the sign of the fraction, but it compares them exactly:
/// the date that it counts as equal is the right one. A date of finer steps comes back within a microsecond.
std::optional<Date> date(plist_t node) {
  constexpr std::int32_t kMicroseconds = 1'000'000;
  std::int32_t seconds = 0;
  std::int32_t fraction = 0;
  plist_get_date_val(node, &seconds, &fraction);
  if (seconds == std::numeric_limits<std::int32_t>::min() ||
      seconds == std::numeric_limits<std::int32_t>::max()) {
    return distantDate(node);
  }
  const auto dateAt = [](std::int32_t whole, std::int32_t micro) {
    return Date{static_cast<double>(whole + kLibraryEpochSeconds) + micro / 1e6};
  };
  if (fraction == 0) return dateAt(seconds, 0);
  for (const std::int32_t micro : {fraction, fraction + 1}) {
    for (const auto& [whole, part] :
         {std::pair(seconds, micro), std::pair(seconds - 1, kMicroseconds - micro)}) {
      const Node candidate(plist_new_date(whole, part));
      if (plist_compare_node_value(node, candidate.get())) return dateAt(whole, part);
    }
  }
  return seconds < 0 ? dateAt(seconds - 1, kMicroseconds - fraction) : dateAt(seconds, fraction);
}

class NodeReader {
 public:
  /// Recursion is bounded, as the list's nesting has been checked.
  std::optional<Value> read(plist_t node) {
    switch (plist_get_node_type(node)) {
      case PLIST_BOOLEAN: {
        std::uint8_t truth = 0;
        plist_get_bool_val(node, &truth);
        return Value(truth != 0);
      }
      case PLIST_UINT:
        return integer(node);
      case PLIST_REAL: {
        double number = 0;
        plist_get_real_val(node, &number);
        return Value(number);
      }
      case PLIST_STRING: {
        std::uint64_t length = 0;
        const char* text = plist_get_string_ptr(node, &length);
        return Value(withBrokenUTF8Replaced({text ? text : "", text ? static_cast<std::size_t>(length) : 0}));
      }
      case PLIST_DATA: {
        std::uint64_t length = 0;
        const char* bytes = plist_get_data_ptr(node, &length);
        return Value(Data(bytes ? std::string(bytes, static_cast<std::size_t>(length)) : std::string()));
      }
      case PLIST_DATE:
        return readDate(node);
      case PLIST_UID:
        return readUID(node);
      case PLIST_ARRAY:
        return readArray(node);
      case PLIST_DICT:
        return readDictionary(node);
      default:
        return std::nullopt;
    }
  }

 private:
  static std::optional<Value> readDate(plist_t node) {
    const auto found = date(node);
    return found ? std::optional<Value>(*found) : std::nullopt;
  }

  /// As XML lists write object references.
  static Value readUID(plist_t node) {
    std::uint64_t number = 0;
    plist_get_uid_val(node, &number);
    return Value(Dictionary{{"CF$UID", Value(number)}});
  }

  std::optional<Value> readArray(plist_t node) {
    std::vector<Value> elements;
    elements.reserve(plist_array_get_size(node));
    plist_array_iter raw = nullptr;
    plist_array_new_iter(node, &raw);
    const std::unique_ptr<void, CDeleter> iterator(raw);
    plist_t element = nullptr;
    for (plist_array_next_item(node, raw, &element); element; plist_array_next_item(node, raw, &element)) {
      auto value = read(element);
      if (!value) return std::nullopt;
      elements.push_back(std::move(*value));
    }
    return Value(Array(std::move(elements)));
  }

  std::optional<Value> readDictionary(plist_t node) {
    std::vector<Dictionary::Entry> entries;
    entries.reserve(plist_dict_get_size(node));
    plist_dict_iter raw = nullptr;
    plist_dict_new_iter(node, &raw);
    const std::unique_ptr<void, CDeleter> iterator(raw);
    for (;;) {
      char* rawKey = nullptr;
      plist_t element = nullptr;
      plist_dict_next_item(node, raw, &rawKey, &element);
      const std::unique_ptr<char, CDeleter> key(rawKey);
      if (!element) return Value(Dictionary(std::move(entries)));
      auto value = read(element);
      if (!value) return std::nullopt;
      entries.push_back({withBrokenUTF8Replaced(rawKey ? rawKey : ""), std::move(*value)});
    }
  }
};

}  // namespace

Node nodeFromXML(std::string_view element) {
  plist_t node = nullptr;
  plist_from_xml(element.data(), static_cast<std::uint32_t>(element.size()), &node);
  return Node(node);
}

PropertyListResult propertyListWithBinary(std::string_view bytes) {
  std::string fault = binaryPropertyListFault(bytes);
  if (!fault.empty()) return {std::nullopt, std::move(fault)};
  plist_t raw = nullptr;
  plist_from_bin(bytes.data(), static_cast<std::uint32_t>(bytes.size()), &raw);
  const Node root(raw);
  if (!root) return {std::nullopt, "binary property list: malformed"};
  auto value = NodeReader().read(raw);
  if (!value) return {std::nullopt, "binary property list: holds a value that can't be read"};
  return {std::move(value), {}};
}

}  // namespace tallyd::platform
