#include "platform/dbus/BodyWriter.h"

#include <fmt/format.h>

#include <algorithm>
#include <limits>

#include "platform/UTF8.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/ByteWriter.h"
#include "platform/dbus/Signature.h"

namespace tallyd::platform::dbus {

namespace {

/// Thrown within this file only.
struct Unwritable {
  std::string reason;
};

bool isPlainText(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char unit) { return unit > 0; });
}

std::string carriableText(std::string_view text) {
  std::string wellFormed = withBrokenUTF8Replaced(text);
  for (std::size_t nul = 0; (nul = wellFormed.find('\0', nul)) != std::string::npos;) {
    wellFormed.replace(nul, 1, kReplacementCharacter);
  }
  return wellFormed;
}

struct VariantType {
  std::string_view operator()(std::monostate) const { return "g"; }
  std::string_view operator()(bool) const { return "b"; }
  std::string_view operator()(std::int64_t) const { return "x"; }
  std::string_view operator()(std::uint64_t) const { return "t"; }
  std::string_view operator()(double) const { return "d"; }
  std::string_view operator()(std::string_view) const { return "s"; }
  std::string_view operator()(Date) const { return "(d)"; }
  std::string_view operator()(const Data&) const { return "ay"; }
  std::string_view operator()(const Array&) const { return "av"; }
  std::string_view operator()(const Dictionary&) const { return "a{sv}"; }
};

class Writer {
 public:
  Writer(ByteWriter& out, std::size_t descriptors) : _out(out), _descriptors(descriptors) {}

  /// @param type  one complete type.
  void write(std::string_view type, const Value& value) {
    switch (type[0]) {
      case 'v':
        return writeVariant(value);
      case 'a':
        return writeAnyArray(type, value);
      case '(':
        if (type != "(d)" || !value.date()) misfit(type);
        _out.align(alignmentOf('('));
        return _out.number(value.date()->secondsSince1970);
      case 's':
        if (!value.string()) misfit(type);
        return writeText(*value.string());
      case 'g':
        if (!value.isNull()) misfit(type);
        return _out.signature("");
      case 'b':
        if (!value.isBoolean()) misfit(type);
        return _out.number(std::uint32_t{value.booleanValue()});
      case 'd':
        if (!value.isReal()) misfit(type);
        return _out.number(*value.realValue());
      case 'h':
        if (_descriptorsUsed == _descriptors) misfit(type);
        return _out.number(static_cast<std::uint32_t>(_descriptorsUsed++));
      default:
        if (!value.isInteger()) misfit(type);
        return writeInteger(type, value);
    }
  }

 private:
  class Level {
   public:
    explicit Level(int& depth) : _depth(depth) {
      if (++_depth > kMaximumContainerDepth) throw Unwritable{"nested too deeply"};
    }
    ~Level() { --_depth; }
    Level(const Level&) = delete;
    Level& operator=(const Level&) = delete;

   private:
    int& _depth;
  };

  [[noreturn]] static void misfit(std::string_view type) {
    throw Unwritable{fmt::format("the value does not fit the type \"{}\"", type)};
  }

  template <class T>
  void writeNarrow(std::string_view type, const Value& value) {
    const auto number = *value.integerValue();
    if (number < std::numeric_limits<T>::min() || number > std::numeric_limits<T>::max()) misfit(type);
    _out.number(static_cast<T>(number));
  }

  void writeInteger(std::string_view type, const Value& value) {
    const bool aboveSigned = value.visit(
        [](const auto& number) { return std::is_same_v<std::decay_t<decltype(number)>, std::uint64_t>; });
    if (type[0] == 't') {
      if (!aboveSigned && *value.integerValue() < 0) misfit(type);
      return _out.number(static_cast<std::uint64_t>(*value.integerValue()));
    }
    if (aboveSigned) misfit(type);
    switch (type[0]) {
      case 'y':
        return writeNarrow<std::uint8_t>(type, value);
      case 'n':
        return writeNarrow<std::int16_t>(type, value);
      case 'q':
        return writeNarrow<std::uint16_t>(type, value);
      case 'i':
        return writeNarrow<std::int32_t>(type, value);
      case 'u':
        return writeNarrow<std::uint32_t>(type, value);
      case 'x':
        return _out.number(*value.integerValue());
      default:
        misfit(type);
    }
  }

  void writeText(std::string_view text) {
    if (isPlainText(text)) return _out.text(text);
    _out.text(carriableText(text));
  }

  void writeAnyArray(std::string_view type, const Value& value) {
    const Level level(_depth);
    const std::string_view element = type.substr(1);
    if (element == "y") {
      if (!value.data()) misfit(type);
      _out.number(static_cast<std::uint32_t>(value.data()->size()));
      return _out.bytes(value.data()->bytes());
    }
    const bool isDictionary = element[0] == '{' && element[1] == 's';
    if (isDictionary ? !value.dictionary() : !value.array()) misfit(type);
    const std::size_t size = _out.reserveNumber();
    _out.align(alignmentOf(element[0]));
    const std::size_t start = _out.position();
    if (isDictionary) {
      writeEntries(element.substr(2, element.size() - 3), *value.dictionary());
    } else {
      for (const Value& each : *value.array()) write(element, each);
    }
    _out.fillIn(size, _out.position() - start);
  }

  void writeEntries(std::string_view valueType, const Dictionary& dictionary) {
    for (const auto& [key, value] : dictionary) {
      _out.align(alignmentOf('{'));
      writeText(key);
      write(valueType, value);
    }
  }

  void writeVariant(const Value& value) {
    const Level level(_depth);
    const std::string_view type = value.visit(VariantType());
    _out.signature(type);
    write(type, value);
  }

  ByteWriter& _out;
  const std::size_t _descriptors;
  std::size_t _descriptorsUsed = 0;
  int _depth = 0;
};

}  // namespace

std::optional<std::string> writeBody(ByteWriter& out, std::string_view signature,
                                     const std::vector<Value>& values, std::size_t descriptors) {
  try {
    Writer writer(out, descriptors);
    for (const Value& value : values) {
      const auto length = completeTypeLength(signature);
      if (length == 0) return "too many values";
      writer.write(signature.substr(0, length), value);
      signature.remove_prefix(length);
    }
  } catch (const Unwritable& unwritable) {
    return unwritable.reason;
  }
  if (!signature.empty()) return "too few values";
  return std::nullopt;
}

}  // namespace tallyd::platform::dbus
