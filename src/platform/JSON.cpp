#include "platform/JSON.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstring>
#include <utility>
#include <vector>

#include "platform/UTF8.h"

namespace tallyd::platform {

namespace {

// Writing

/// Where the library, which formats the real numbers, writes.
struct NumberText {
  using Ch = char;
  static constexpr std::size_t kLongest = 32;  ///< Beyond the shortest text of every double.
  std::array<char, kLongest> bytes;
  std::size_t length = 0;
  void Put(char byte) { bytes[length++] = byte; }
  void Flush() {}
};

/// Whether eight bytes all stand for themselves in a JSON string: ASCII, no control, no quote, no backslash.
bool standForThemselves(std::uint64_t bytes) {
  constexpr std::uint64_t kOnes = 0x0101010101010101;
  constexpr std::uint64_t kHighs = 0x8080808080808080;
  const auto holdsLessThan = [](std::uint64_t word, std::uint64_t limit) {
    return (word - kOnes * limit) & ~word & kHighs;
  };
  return ((bytes & kHighs) | holdsLessThan(bytes, 0x20) | holdsLessThan(bytes ^ kOnes * '"', 1) |
          holdsLessThan(bytes ^ kOnes * '\\', 1)) == 0;
}

bool standsForItself(unsigned char byte) {
  return byte >= 0x20 && byte < 0x80 && byte != '"' && byte != '\\';
}

/// Up to seven bytes as one word; what is missing is filled up with letters.
std::uint64_t shortWord(std::string_view text) {
  constexpr std::uint64_t kLetters = 0x6161616161616161;
  if (text.size() >= 4) {
    std::uint32_t front = 0;
    std::uint32_t back = 0;
    std::memcpy(&front, text.data(), sizeof front);
    std::memcpy(&back, text.data() + text.size() - sizeof back, sizeof back);
    return std::uint64_t{front} << 32 | back;
  }
  std::uint64_t word = kLetters;
  for (const char c : text) word = word << 8 | static_cast<unsigned char>(c);
  return word;
}

/// Length of the longest start of `text` that needs no look at single characters.
std::size_t plainLength(std::string_view text) {
  constexpr std::size_t kWord = sizeof(std::uint64_t);
  if (text.size() < kWord && standForThemselves(shortWord(text))) return text.size();
  const auto wordAt = [text](std::size_t place) {
    std::uint64_t word = 0;
    std::memcpy(&word, text.data() + place, sizeof word);
    return word;
  };
  std::size_t length = 0;
  while (length + kWord <= text.size() && standForThemselves(wordAt(length))) length += kWord;
  // The last ones with some that have been looked at already.
  if (length > 0 && length + kWord > text.size() && standForThemselves(wordAt(text.size() - kWord)))
    return text.size();
  while (length < text.size() && standsForItself(static_cast<unsigned char>(text[length]))) ++length;
  return length;
}

/// How a control character, a quote or a backslash is written.
std::string escapeOf(unsigned char byte) {
  switch (byte) {
    case '"':
      return "\\\"";
    case '\\':
      return "\\\\";
    case '\b':
      return "\\b";
    case '\f':
      return "\\f";
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      return fmt::format("\\u{:04X}", byte);
  }
}

}  // namespace

/// Writes one value, whatever it holds.
class JSONText::Writer {
 public:
  explicit Writer(JSONText& text) : _json(text) {}

  bool write(const Value& value) { return value.visit(*this); }

  bool operator()(std::monostate) { return literal("null"); }
  bool operator()(bool value) { return literal(value ? "true" : "false"); }
  bool operator()(std::int64_t value) { return literal(fmt::format_int(value)); }
  bool operator()(std::uint64_t value) { return literal(fmt::format_int(value)); }
  bool operator()(double value) {
    if (!std::isfinite(value)) return false;
    NumberText text;
    rapidjson::Writer<NumberText>(text).Double(value);
    return literal({text.bytes.data(), text.length});
  }
  bool operator()(Date) { return false; }
  bool operator()(const Data&) { return false; }
  bool operator()(std::string_view text) {
    _json.text(text);
    return true;
  }
  bool operator()(const Array& array) {
    if (++_depth > kMaximumValueDepth) return false;
    _json.startArray();
    for (const Value& element : array) {
      if (!write(element)) return false;
    }
    --_depth;
    _json.endArray();
    return true;
  }
  bool operator()(const Dictionary& dictionary) {
    if (++_depth > kMaximumValueDepth) return false;
    _json.startObject();
    for (const auto& [key, element] : dictionary) {
      _json.key(key);
      if (!write(element)) return false;
    }
    --_depth;
    _json.endObject();
    return true;
  }

 private:
  bool literal(std::string_view text) {
    _json.written(text);
    return true;
  }
  bool literal(const fmt::format_int& number) { return literal({number.data(), number.size()}); }

  JSONText& _json;
  int _depth = 0;
};

void JSONText::key(std::string_view name) {
  separate();
  quote(name);
  append(':');
  _needsComma = false;
}

void JSONText::text(std::string_view value) {
  separate();
  quote(value);
}

bool JSONText::value(const Value& value) { return Writer(*this).write(value); }

void JSONText::written(std::string_view json) {
  separate();
  append(json);
}

void JSONText::start(char bracket) {
  separate();
  append(bracket);
  _needsComma = false;
}

void JSONText::end(char bracket) {
  append(bracket);
  _needsComma = true;
}

/// Before a value, or a key.
void JSONText::separate() {
  if (std::exchange(_needsComma, true)) append(',');
}

void JSONText::quote(std::string_view text) {
  const std::size_t plain = plainLength(text);
  char* place = roomFor(plain + 2);
  *place++ = '"';
  if (plain > 0) std::memcpy(place, text.data(), plain);
  _length += plain + 1;
  if (plain < text.size()) {
    text.remove_prefix(plain);
    while (!text.empty()) {
      text.remove_prefix(appendSpecial(text));
      const std::size_t next = plainLength(text);
      append(text.substr(0, next));
      text.remove_prefix(next);
    }
  }
  append('"');
}

/// Appends the first character of `text`, which doesn't stand for itself; returns how many bytes it has.
std::size_t JSONText::appendSpecial(std::string_view text) {
  const auto byte = static_cast<unsigned char>(text[0]);
  if (byte < 0x80) {
    append(escapeOf(byte));
    return 1;
  }
  const UTF8Sequence sequence = firstUTF8Sequence(text);
  append(sequence.wellFormed ? text.substr(0, sequence.length) : kReplacementCharacter);
  return sequence.length;
}

void JSONText::append(std::string_view text) {
  if (!text.empty()) std::memcpy(roomFor(text.size()), text.data(), text.size());
  _length += text.size();
}

void JSONText::append(char byte) {
  *roomFor(1) = byte;
  ++_length;
}

void JSONText::grow(std::size_t atLeast) {
  constexpr std::size_t kLeast = 256;
  _size = std::max({kLeast, 2 * _size, atLeast});
  auto room = std::make_unique_for_overwrite<char[]>(_size);
  if (_length > 0) std::memcpy(room.get(), _room.get(), _length);
  _room = std::move(room);
}

namespace {

// Reading

/// The JSON number that is all of `text`, if it has one of type `Number`.
template <class Number>
std::optional<Number> numberIn(std::string_view text) {
  Number number{};
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number);
  return error == std::errc() && stop == end ? std::optional(number) : std::nullopt;
}

/// An integer where 64 bits hold it, else the nearest real number; nothing when that is infinite.
std::optional<Value> valueOfNumber(std::string_view text) {
  if (const auto number = numberIn<std::int64_t>(text)) return Value(*number);
  if (const auto number = numberIn<std::uint64_t>(text)) return Value(*number);
  if (const auto number = numberIn<double>(text)) return Value(*number);
  // Beyond the doubles. The reader refuses exponents that would be beyond these, but for those toward zero.
  const auto wide = numberIn<long double>(text).value_or(0);
  if (std::fabs(wide) > 1) return std::nullopt;
  return Value(static_cast<double>(wide));
}

/// Builds a value from the reader's events; refuses what is nested too deep.
class ValueBuilder : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, ValueBuilder> {
 public:
  bool Null() { return add(Value()); }
  bool Bool(bool value) { return add(Value(value)); }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    auto value = valueOfNumber({text, length});
    return value ? add(*std::move(value)) : refuse(rapidjson::kParseErrorNumberTooBig);
  }
  bool String(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return isText({text, length}) && add(Value(std::string_view(text, length)));
  }
  bool Key(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    _open.back().key.assign(text, length);
    return isText({text, length});
  }
  bool StartObject() { return open(Kind::Object); }
  bool StartArray() { return open(Kind::Array); }
  bool EndObject(rapidjson::SizeType /*count*/) {
    Dictionary dictionary(std::move(_open.back().entries));
    _open.pop_back();
    return add(Value(std::move(dictionary)));
  }
  bool EndArray(rapidjson::SizeType /*count*/) {
    Array array(std::move(_open.back().elements));
    _open.pop_back();
    return add(Value(std::move(array)));
  }

  Value takeRoot() { return std::move(_root); }
  /// Why the builder refused, if not for nesting.
  [[nodiscard]] std::optional<rapidjson::ParseErrorCode> refusal() const { return _refusal; }

 private:
  enum class Kind { Object, Array };

  /// A container whose end has not come yet; only one of the two lists is used.
  struct Open {
    std::vector<Dictionary::Entry> entries;
    std::vector<Value> elements;
    std::string key;
    Kind kind;
  };

  bool refuse(rapidjson::ParseErrorCode reason) {
    _refusal = reason;
    return false;
  }

  /// The reader sees to the text's encoding, and lets the second half of a surrogate pair stand alone.
  bool isText(std::string_view text) {
    return isUTF8(text) || refuse(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
  }

  bool open(Kind kind) {
    if (_open.size() >= kMaximumValueDepth) return false;
    _open.push_back({{}, {}, {}, kind});
    return true;
  }

  bool add(Value value) {
    if (_open.empty()) {
      _root = std::move(value);
    } else if (_open.back().kind == Kind::Object) {
      _open.back().entries.push_back({std::move(_open.back().key), std::move(value)});
    } else {
      _open.back().elements.push_back(std::move(value));
    }
    return true;
  }

  std::vector<Open> _open;
  Value _root;
  std::optional<rapidjson::ParseErrorCode> _refusal;
};

std::string errorText(rapidjson::ParseErrorCode code, std::size_t offset) {
  if (code == rapidjson::kParseErrorTermination) {
    return fmt::format("nested deeper than {} levels, at byte {}", kMaximumValueDepth, offset);
  }
  return fmt::format("{} (at byte {})", rapidjson::GetParseError_En(code), offset);
}

}  // namespace

std::optional<std::string> jsonFromValue(const Value& value) {
  JSONText text;
  if (!text.value(value)) return std::nullopt;
  return text.string();
}

JSONResult valueFromJSON(std::string_view text) {
  // The library's own conversion makes a NaN of the largest numbers and takes undefined steps with some
  // zeros.
  constexpr unsigned kFlags = rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseValidateEncodingFlag;
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  const std::size_t skipped = text.starts_with(kByteOrderMark) ? kByteOrderMark.size() : 0;
  text.remove_prefix(skipped);
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  ValueBuilder builder;
  if (!reader.Parse<kFlags>(stream, builder)) {
    const auto code = builder.refusal().value_or(reader.GetParseErrorCode());
    return {std::nullopt, errorText(code, skipped + reader.GetErrorOffset())};
  }
  // The reader takes a NUL byte for the end.
  if (stream.Tell() < text.size()) {
    return {std::nullopt, errorText(rapidjson::kParseErrorDocumentRootNotSingular, skipped + stream.Tell())};
  }
  return {builder.takeRoot(), {}};
}

}  // namespace tallyd::platform
