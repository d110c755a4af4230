#include "platform/property-list/ASCIIPropertyList.h"

#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "platform/UTF8.h"

namespace tallyd::platform {

namespace {

bool isBlank(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }
bool isOctalDigit(char c) { return c >= '0' && c <= '7'; }
bool isBare(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
         std::string_view("_$/:.-+").find(c) != std::string_view::npos;
}
int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

/// A recursive reader; every function returns nothing once `_error` is set.
class ASCIIReader {
 public:
  explicit ASCIIReader(std::string_view text) : _text(text) {}

  PropertyListResult read() {
    std::optional<Value> value = readValue();
    if (value && (!skipBlanks() || !atEnd())) {
      value.reset();
      if (_error.empty()) fail("text after the end of the list");
    }
    return {std::move(value), std::move(_error)};
  }

 private:
  std::nullopt_t fail(std::string_view what) {
    if (_error.empty()) _error = fmt::format("ASCII property list: {} at byte {}", what, _position);
    return std::nullopt;
  }

  [[nodiscard]] bool atEnd() const { return _position == _text.size(); }
  [[nodiscard]] std::string_view rest() const { return _text.substr(_position); }
  bool take(char c) {
    if (atEnd() || _text[_position] != c) return false;
    ++_position;
    return true;
  }

  /// Passes over blanks and comments; false when a comment has no end.
  bool skipBlanks() {
    while (!atEnd()) {
      if (isBlank(_text[_position])) {
        ++_position;
      } else if (rest().starts_with("//")) {
        _position = std::min(_text.find('\n', _position), _text.size());
      } else if (rest().starts_with("/*")) {
        const std::size_t end = _text.find("*/", _position + 2);
        if (end == std::string_view::npos) return fail("comment without an end"), false;
        _position = end + 2;
      } else {
        break;
      }
    }
    return true;
  }

  std::optional<Value> readValue() {
    if (!skipBlanks()) return std::nullopt;
    if (atEnd()) return fail("the list ends where a value is due");
    switch (_text[_position]) {
      case '{':
        return readNested(&ASCIIReader::readDictionary);
      case '(':
        return readNested(&ASCIIReader::readArray);
      case '<':
        return readData();
      default:
        break;
    }
    auto text = readText();
    return text ? std::optional<Value>(std::move(*text)) : std::nullopt;
  }

  std::optional<Value> readNested(std::optional<Value> (ASCIIReader::*readContainer)()) {
    if (_depth == kMaximumPropertyListDepth) return fail("nested too deep");
    ++_depth;
    ++_position;
    auto value = (this->*readContainer)();
    --_depth;
    return value;
  }

  std::optional<Value> readDictionary() {
    std::vector<Dictionary::Entry> entries;
    for (;;) {
      if (!skipBlanks()) return std::nullopt;
      if (take('}')) return Value(Dictionary(std::move(entries)));
      auto key = readText();
      if (!key || !skipBlanks()) return std::nullopt;
      if (!take('=')) return fail("'=' is missing");
      auto value = readValue();
      if (!value || !skipBlanks()) return std::nullopt;
      entries.push_back({std::move(*key), std::move(*value)});
      // The semicolon after the last entry may be missing.
      if (!take(';') && !rest().starts_with('}')) return fail("';' is missing");
    }
  }

  std::optional<Value> readArray() {
    std::vector<Value> elements;
    for (;;) {
      if (!skipBlanks()) return std::nullopt;
      if (take(')')) return Value(Array(std::move(elements)));
      auto value = readValue();
      if (!value || !skipBlanks()) return std::nullopt;
      elements.push_back(std::move(*value));
      if (!take(',') && !rest().starts_with(')')) return fail("',' is missing");
    }
  }

  std::optional<Value> readData() {
    ++_position;
    std::string bytes;
    int high = -1;
    for (; !atEnd(); ++_position) {
      const char c = _text[_position];
      if (isBlank(c)) continue;
      const int digit = hexDigit(c);
      if (digit < 0) break;
      if (high < 0) {
        high = digit;
      } else {
        bytes += static_cast<char>(std::exchange(high, -1) << 4 | digit);
      }
    }
    if (high >= 0) return fail("odd number of digits in data");
    if (!take('>')) return fail("'>' is missing");
    return Value(Data(std::move(bytes)));
  }

  std::optional<std::string> readText() {
    if (!atEnd() && (_text[_position] == '"' || _text[_position] == '\'')) return readQuoted();
    const std::size_t start = _position;
    while (!atEnd() && isBare(_text[_position])) ++_position;
    if (_position == start)
      return fail(atEnd() ? "the list ends where a string is due" : "no value begins with this");
    return std::string(_text.substr(start, _position - start));
  }

  std::optional<std::string> readQuoted() {
    const char quote = _text[_position++];
    std::string text;
    while (!atEnd()) {
      const char c = _text[_position++];
      if (c == quote) return withBrokenUTF8Replaced(text);
      if (c != '\\') {
        text += c;
      } else if (!atEnd()) {
        readEscape(text);
      }
    }
    return fail("string without an end");
  }

  /// Appends what the escape behind a backslash stands for; a character without a meaning of its own is
  /// itself.
  void readEscape(std::string& text) {
    if (isOctalDigit(_text[_position])) return appendUTF8(text, readOctal());
    const char c = _text[_position++];
    constexpr std::string_view kLetters = "abfnrtv";
    constexpr std::string_view kMeanings = "\a\b\f\n\r\t\v";
    if (c == 'U' || c == 'u') {
      readUnicode(text);
    } else if (const auto letter = kLetters.find(c); letter != std::string_view::npos) {
      text += kMeanings[letter];
    } else if (c != '\n') {  // An escaped line end only breaks the line in the file.
      text += c;
    }
  }

  std::uint32_t readOctal() {
    std::uint32_t number = 0;
    for (int i = 0; i < 3 && !atEnd() && isOctalDigit(_text[_position]); ++i) {
      number = number * 8 + static_cast<std::uint32_t>(_text[_position++] - '0');
    }
    return number;
  }

  /// Up to four hexadecimal digits: one UTF-16 unit.
  std::uint32_t readUnit() {
    std::uint32_t unit = 0;
    for (int i = 0; i < 4 && !atEnd() && hexDigit(_text[_position]) >= 0; ++i) {
      unit = unit << 4 | static_cast<std::uint32_t>(hexDigit(_text[_position++]));
    }
    return unit;
  }

  void readUnicode(std::string& text) {
    const std::uint32_t unit = readUnit();
    const std::size_t behind = _position;
    if (unit >= 0xD800 && unit < 0xDC00 && (rest().starts_with("\\U") || rest().starts_with("\\u"))) {
      _position += 2;
      const std::uint32_t low = readUnit();
      if (low >= 0xDC00 && low < 0xE000)
        return appendUTF8(text, 0x10000 + ((unit - 0xD800) << 10) + (low - 0xDC00));
      _position = behind;
    }
    appendUTF8(text, unit);
  }

  std::string_view _text;
  std::size_t _position = 0;
  int _depth = 0;
  std::string _error;
};

}  // namespace

PropertyListResult propertyListWithASCII(std::string_view text) { return ASCIIReader(text).read(); }

}  // namespace tallyd::platform
