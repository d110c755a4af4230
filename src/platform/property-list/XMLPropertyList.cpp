#include "platform/property-list/XMLPropertyList.h"

#include <expat.h>
#include <fmt/format.h>

#include <algorithm>
#include <memory>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/UTF8.h"
#include "platform/property-list/XMLScalar.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

struct ParserDeleter {
  void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
};
using Parser = std::unique_ptr<std::remove_pointer_t<XML_Parser>, ParserDeleter>;

/// Builds the value from the parser's events and stops the parser at the first thing that is wrong.
class XMLReader {
 public:
  XMLReader() : _parser(XML_ParserCreate("UTF-8")) {
    if (!_parser) throw std::bad_alloc();
    XML_SetUserData(_parser.get(), this);
    XML_SetElementHandler(
        _parser.get(),
        [](void* self, const char* name, const char** /*attributes*/) {
          guarded(self, &XMLReader::start, name);
        },
        [](void* self, const char* /*name*/) { guarded(self, &XMLReader::end); });
    XML_SetCharacterDataHandler(_parser.get(), [](void* self, const char* text, int length) {
      guarded(self, &XMLReader::addText, std::string_view(text, static_cast<std::size_t>(length)));
    });
    XML_SetEntityDeclHandler(_parser.get(), [](void* self, auto... /*declaration*/) {
      guarded(self, &XMLReader::fail, "the list declares entities");
    });
  }

  PropertyListResult read(std::string_view bytes) {
    const auto status = XML_Parse(_parser.get(), bytes.data(), static_cast<int>(bytes.size()), XML_TRUE);
    if (status != XML_STATUS_OK && _error.empty()) fail(XML_ErrorString(XML_GetErrorCode(_parser.get())));
    if (_error.empty() && !_root) fail("the list holds no value");
    if (!_error.empty()) return {std::nullopt, std::move(_error)};
    return {std::move(_root), {}};
  }

 private:
  /// An element whose end has not come yet.
  struct Open {
    XMLElement element;
    std::vector<Dictionary::Entry> entries;  ///< Of a dictionary.
    std::vector<Value> elements;             ///< Of an array.
    std::optional<std::string> key;          ///< Of a dictionary whose next value is due.
  };

  /// Runs a member function from within the parser, which is written in C and must not see an exception.
  template <class... Parameters, class... Arguments>
  static void guarded(void* self, void (XMLReader::*function)(Parameters...), Arguments... arguments) {
    auto* reader = static_cast<XMLReader*>(self);
    if (!reader->_error.empty()) return;
    try {
      (reader->*function)(arguments...);
    } catch (const std::exception& failure) {
      reader->fail(failure.what());
    }
  }

  void fail(std::string_view what) {
    if (!_error.empty()) return;
    _error = fmt::format("XML property list: {} at byte {}", what, XML_GetCurrentByteIndex(_parser.get()));
    XML_StopParser(_parser.get(), XML_FALSE);
  }

  static bool holdsValues(XMLElement element) {
    return element == XMLElement::List || element == XMLElement::Array || element == XMLElement::Dictionary;
  }

  void start(std::string_view name) {
    const XMLElement element = xmlElementNamed(name);
    const XMLElement parent = _open.empty() ? XMLElement::None : _open.back().element;
    if (element == XMLElement::None) return fail("unknown element");
    if (element == XMLElement::List ? !_open.empty() : !_open.empty() && !holdsValues(parent)) {
      return fail("element in a place where none may be");
    }
    const bool isKeyDue = parent == XMLElement::Dictionary && !_open.back().key;
    if (isKeyDue != (element == XMLElement::Key))
      return fail(isKeyDue ? "a key is missing" : "a key with no use");
    if (element == XMLElement::Array || element == XMLElement::Dictionary) ++_depth;
    if (_depth > kMaximumPropertyListDepth) return fail("nested too deep");
    _text.clear();
    _open.push_back({element, {}, {}, {}});
  }

  void addText(std::string_view text) {
    if (!_open.empty() && !holdsValues(_open.back().element)) {
      _text += text;
    } else if (text.find_first_not_of(kBlanks) != std::string_view::npos) {
      fail("text between elements");
    }
  }

  void end() {
    Open closed = std::move(_open.back());
    _open.pop_back();
    switch (closed.element) {
      case XMLElement::List:
        return;
      case XMLElement::Key:
        _open.back().key = std::exchange(_text, {});
        return;
      case XMLElement::Array:
        --_depth;
        return add(Array(std::move(closed.elements)));
      case XMLElement::Dictionary:
        if (closed.key) return fail("a key without a value");
        --_depth;
        return add(Dictionary(std::move(closed.entries)));
      default:
        break;
    }
    auto scalar = xmlScalar(closed.element, std::exchange(_text, {}));
    return scalar ? add(std::move(*scalar)) : fail("text that is no value of its kind");
  }

  void add(Value value) {
    if (_open.empty() || _open.back().element == XMLElement::List) {
      if (_root) return fail("more than one value");
      _root = std::move(value);
    } else if (_open.back().element == XMLElement::Array) {
      _open.back().elements.push_back(std::move(value));
    } else {
      _open.back().entries.push_back({std::move(*_open.back().key), std::move(value)});
      _open.back().key.reset();
    }
  }

  Parser _parser;
  std::vector<Open> _open;
  int _depth = 0;
  std::string _text;
  std::optional<Value> _root;
  std::string _error;
};

bool isText(std::string_view bytes) {
  while (!bytes.empty()) {
    const UTF8Sequence sequence = firstUTF8Sequence(bytes);
    if (!sequence.wellFormed || bytes[0] == '\0') return false;
    bytes.remove_prefix(sequence.length);
  }
  return true;
}

std::string asText(std::string_view bytes) {
  const std::string wellFormed = withBrokenUTF8Replaced(bytes);
  std::string text;
  text.reserve(wellFormed.size());
  for (const char byte : wellFormed) {
    if (byte == '\0') {
      text += kReplacementCharacter;
    } else {
      text += byte;
    }
  }
  return text;
}

}  // namespace

PropertyListResult propertyListWithXML(std::string_view bytes) {
  // The parser takes a declaration of the encoding at the very start only.
  bytes.remove_prefix(std::min(bytes.find_first_not_of(kBlanks), bytes.size()));
  if (isText(bytes)) return XMLReader().read(bytes);
  return XMLReader().read(asText(bytes));
}

bool looksLikeXML(std::string_view bytes) {
  bytes.remove_prefix(std::min(bytes.find_first_not_of(kBlanks), bytes.size()));
  if (!bytes.starts_with('<')) return false;
  bytes.remove_prefix(1);
  if (bytes.starts_with('?') || bytes.starts_with('!')) return true;
  return xmlElementNamed(bytes.substr(0, bytes.find_first_of(" \t\r\n/>"))) != XMLElement::None;
}

}  // namespace tallyd::platform
