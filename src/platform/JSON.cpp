#include "platform/JSON.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <charconv>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <new>
#include <vector>

#include "platform/UTF8.h"

namespace tallyd::platform {

namespace {

// Writing

/// Says that there is no memory left; RapidJSON, left to itself, would write where it got none.
class ThrowingAllocator {
 public:
  [[maybe_unused]] static constexpr bool kNeedFree = true;  // For the library.

  static void* Malloc(std::size_t size) { return size == 0 ? nullptr : checked(std::malloc(size)); }
  static void* Realloc(void* memory, std::size_t /*size*/, std::size_t newSize) {
    if (newSize > 0) return checked(std::realloc(memory, newSize));
    std::free(memory);
    return nullptr;
  }
  static void Free(void* memory) { std::free(memory); }
  bool operator==(const ThrowingAllocator&) const { return true; }

 private:
  static void* checked(void* memory) {
    if (!memory) throw std::bad_alloc();
    return memory;
  }
};

using JSONBuffer = rapidjson::GenericStringBuffer<rapidjson::UTF8<>, ThrowingAllocator>;
using JSONWriter = rapidjson::Writer<JSONBuffer, rapidjson::UTF8<>, rapidjson::UTF8<>, ThrowingAllocator>;

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

/// Length of the longest start of `text` that needs no look at single characters.
std::size_t plainLength(std::string_view text) {
  std::size_t length = 0;
  for (std::uint64_t word = 0; length + sizeof word <= text.size(); length += sizeof word) {
    std::memcpy(&word, text.data() + length, sizeof word);
    if (!standForThemselves(word)) break;
  }
  while (length < text.size() && standsForItself(static_cast<unsigned char>(text[length]))) ++length;
  return length;
}

/// RapidJSON's writer with strings that are copied run by run instead of byte by byte, and checked on the
/// way.
class ValueWriter : public JSONWriter {
 public:
  explicit ValueWriter(JSONBuffer& buffer) : JSONWriter(buffer) {}

  bool write(const Value& value) { return value.visit(*this); }

  bool operator()(std::monostate) { return Null(); }
  bool operator()(bool value) { return Bool(value); }
  bool operator()(std::int64_t value) { return Int64(value); }
  bool operator()(std::uint64_t value) { return Uint64(value); }
  bool operator()(double value) { return Double(value); }
  bool operator()(Date) { return false; }
  bool operator()(const Data&) { return false; }
  bool operator()(std::string_view text) {
    Prefix(rapidjson::kStringType);
    writeText(text);
    return EndValue(true);
  }
  bool operator()(const Array& array) {
    if (++_depth > kMaximumValueDepth) return false;
    StartArray();
    for (const Value& element : array) {
      if (!write(element)) return false;
    }
    --_depth;
    return EndArray();
  }
  bool operator()(const Dictionary& dictionary) {
    if (++_depth > kMaximumValueDepth) return false;
    StartObject();
    for (const auto& [key, element] : dictionary) {
      (*this)(std::string_view(key));
      if (!write(element)) return false;
    }
    --_depth;
    return EndObject();
  }

 private:
  void append(std::string_view text) {
    if (!text.empty()) std::memcpy(os_->Push(text.size()), text.data(), text.size());
  }

  void writeText(std::string_view text) {
    os_->Put('"');
    while (!text.empty()) {
      const std::size_t plain = plainLength(text);
      append(text.substr(0, plain));
      text.remove_prefix(plain);
      if (!text.empty()) text.remove_prefix(writeSpecial(text));
    }
    os_->Put('"');
  }

  /// Writes the first character of `text`, which doesn't stand for itself, and returns how many bytes it has.
  std::size_t writeSpecial(std::string_view text) {
    const auto byte = static_cast<unsigned char>(text[0]);
    if (byte < 0x80) {
      writeEscape(byte);
      return 1;
    }
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    append(sequence.wellFormed ? text.substr(0, sequence.length) : kReplacementCharacter);
    return sequence.length;
  }

  void writeEscape(unsigned char byte) {
    switch (byte) {
      case '"':
        return append("\\\"");
      case '\\':
        return append("\\\\");
      case '\b':
        return append("\\b");
      case '\f':
        return append("\\f");
      case '\n':
        return append("\\n");
      case '\r':
        return append("\\r");
      case '\t':
        return append("\\t");
      default:
        constexpr std::string_view kDigits = "0123456789ABCDEF";
        append("\\u00");
        os_->Put(kDigits[byte >> 4]);
        os_->Put(kDigits[byte & 15]);
    }
  }

  int _depth = 0;
};

// Reading

/// The number at the end of `text`; nothing for one that is too big.
std::optional<double> numberThatEnds(std::string_view text) {
  const auto before = text.find_last_not_of("0123456789+-.eE");
  text.remove_prefix(before == std::string_view::npos ? 0 : before + 1);
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return error == std::errc() ? std::optional(number) : std::nullopt;
}

/// Builds a value from the reader's events; refuses what is nested too deep.
class ValueBuilder : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, ValueBuilder> {
 public:
  /// Borrows what is read, and where it has got to.
  ValueBuilder(std::string_view text, const rapidjson::MemoryStream& stream) : _text(text), _stream(stream) {}

  bool Null() { return add(Value()); }
  bool Bool(bool value) { return add(Value(value)); }
  bool Int(int value) { return add(Value(value)); }
  bool Uint(unsigned value) { return add(Value(value)); }
  bool Int64(std::int64_t value) { return add(Value(value)); }
  bool Uint64(std::uint64_t value) { return add(Value(value)); }
  bool Double(double value) {
    // Of the largest numbers that there are the library makes none.
    const auto exact =
        std::isfinite(value) ? std::optional(value) : numberThatEnds(_text.substr(0, _stream.Tell()));
    if (!exact) _isTooBig = true;
    return exact && add(Value(*exact));
  }
  bool String(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return add(Value(std::string(text, length)));
  }
  bool Key(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    _open.back().key.assign(text, length);
    return true;
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
  [[nodiscard]] bool isTooBig() const { return _isTooBig; }  ///< Why the builder refused, if not for nesting.

 private:
  enum class Kind { Object, Array };

  /// A container whose end has not come yet; only one of the two lists is used.
  struct Open {
    std::vector<Dictionary::Entry> entries;
    std::vector<Value> elements;
    std::string key;
    Kind kind;
  };

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

  const std::string_view _text;
  const rapidjson::MemoryStream& _stream;
  std::vector<Open> _open;
  Value _root;
  bool _isTooBig = false;
};

std::string errorText(rapidjson::ParseErrorCode code, std::size_t offset) {
  if (code == rapidjson::kParseErrorTermination) {
    return fmt::format("nested deeper than {} levels, at byte {}", kMaximumValueDepth, offset);
  }
  return fmt::format("{} (at byte {})", rapidjson::GetParseError_En(code), offset);
}

}  // namespace

std::optional<std::string> jsonFromValue(const Value& value) {
  JSONBuffer buffer;
  ValueWriter writer(buffer);
  if (!writer.write(value)) return std::nullopt;
  return std::string(buffer.GetString(), buffer.GetSize());
}

JSONResult valueFromJSON(std::string_view text) {
  constexpr unsigned kFlags = rapidjson::kParseFullPrecisionFlag | rapidjson::kParseValidateEncodingFlag;
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  const std::size_t skipped = text.starts_with(kByteOrderMark) ? kByteOrderMark.size() : 0;
  text.remove_prefix(skipped);
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  ValueBuilder builder(text, stream);
  if (!reader.Parse<kFlags>(stream, builder)) {
    const auto code = builder.isTooBig() ? rapidjson::kParseErrorNumberTooBig : reader.GetParseErrorCode();
    return {std::nullopt, errorText(code, skipped + reader.GetErrorOffset())};
  }
  // The reader takes a NUL byte for the end.
  if (stream.Tell() < text.size()) {
    return {std::nullopt, errorText(rapidjson::kParseErrorDocumentRootNotSingular, skipped + stream.Tell())};
  }
  return {builder.takeRoot(), {}};
}

}  // namespace tallyd::platform
