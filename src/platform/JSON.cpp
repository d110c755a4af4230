#include "platform/JSON.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <cstring>
#include <limits>
#include <vector>

#include "platform/UTF8.h"

namespace tallyd::platform {

namespace {

// Writing

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
class ValueWriter : public rapidjson::Writer<rapidjson::StringBuffer> {
 public:
  explicit ValueWriter(rapidjson::StringBuffer& buffer) : Writer(buffer) {}

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

/// Builds a value from the reader's events; refuses what is nested too deep.
class ValueBuilder : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, ValueBuilder> {
 public:
  bool Null() { return add(Value()); }
  bool Bool(bool value) { return add(Value(value)); }
  bool Int(int value) { return add(Value(value)); }
  bool Uint(unsigned value) { return add(Value(value)); }
  bool Int64(std::int64_t value) { return add(Value(value)); }
  bool Uint64(std::uint64_t value) { return add(Value(value)); }
  bool Double(double value) { return add(Value(value)); }
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

  std::vector<Open> _open;
  Value _root;
};

std::string errorText(rapidjson::ParseErrorCode code, std::size_t offset) {
  if (code == rapidjson::kParseErrorTermination) {
    return fmt::format("nested deeper than {} levels, at byte {}", kMaximumValueDepth, offset);
  }
  return fmt::format("{} (at byte {})", rapidjson::GetParseError_En(code), offset);
}

}  // namespace

std::optional<std::string> jsonFromValue(const Value& value) {
  rapidjson::StringBuffer buffer;
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
  ValueBuilder builder;
  if (!reader.Parse<kFlags>(stream, builder)) {
    return {std::nullopt, errorText(reader.GetParseErrorCode(), skipped + reader.GetErrorOffset())};
  }
  // The reader takes a NUL byte for the end.
  if (stream.Tell() < text.size()) {
    return {std::nullopt, errorText(rapidjson::kParseErrorDocumentRootNotSingular, skipped + stream.Tell())};
  }
  return {builder.takeRoot(), {}};
}

}  // namespace tallyd::platform
