#include "platform/dbus/BodyReader.h"

#include <fmt/format.h>

#include "platform/dbus/ByteReader.h"
#include "platform/dbus/Signature.h"

namespace tallyd::platform::dbus {

namespace {

/// D-Bus Specification, "Marshaling (Wire Format)": 64 MiB.
constexpr std::uint32_t kMaximumArrayBytes = 1U << 26;

class Reader {
 public:
  Reader(std::string_view body, std::endian order, std::vector<FileDescriptor> came,
         std::vector<FileDescriptor>& used)
      : _bytes(body, order), _came(std::move(came)), _used(used) {}

  /// @param type  one complete type.
  Value read(std::string_view type) {
    if (_valuesLeft-- == 0) throwMalformed("too many values");
    switch (type[0]) {
      case 'v':
        return readVariant();
      case 'a':
        return readAnyArray(type.substr(1));
      case '(':
        return readDate(type);
      case 's':
        return Value(_bytes.text());
      case 'g':
        if (!_bytes.signature().empty()) throwMalformed("a signature is no value");
        return {};
      case 'b':
        return readBoolean();
      case 'd':
        return Value(_bytes.number<double>());
      case 'h':
        return readDescriptor();
      default:
        return readInteger(type[0]);
    }
  }

  [[nodiscard]] bool isAtEnd() const { return _bytes.isAtEnd(); }

 private:
  /// Counts a level of nesting for as long as it lives.
  class Level {
   public:
    explicit Level(int& depth) : _depth(depth) {
      if (++_depth > kMaximumContainerDepth) throwMalformed("nested too deeply");
    }
    ~Level() { --_depth; }
    Level(const Level&) = delete;
    Level& operator=(const Level&) = delete;

   private:
    int& _depth;
  };

  Value readInteger(char type) {
    switch (type) {
      case 'y':
        return Value(std::int64_t{_bytes.number<std::uint8_t>()});
      case 'n':
        return Value(std::int64_t{_bytes.number<std::int16_t>()});
      case 'q':
        return Value(std::int64_t{_bytes.number<std::uint16_t>()});
      case 'i':
        return Value(std::int64_t{_bytes.number<std::int32_t>()});
      case 'u':
        return Value(std::int64_t{_bytes.number<std::uint32_t>()});
      case 'x':
        return Value(_bytes.number<std::int64_t>());
      case 't':
        return Value(_bytes.number<std::uint64_t>());
      default:
        throw Malformed{fmt::format("type '{}' is no value", type)};
    }
  }

  Value readBoolean() {
    const auto number = _bytes.number<std::uint32_t>();
    if (number > 1) throwMalformed("a boolean that is neither 0 nor 1");
    return Value(number == 1);
  }

  Value readVariant() {
    const Level level(_depth);
    const std::string_view inner = _bytes.signature();
    if (!isOneCompleteType(inner)) throwMalformed("a variant of no single type");
    const bool outermost = !_inVariant;
    _inVariant = true;
    Value value = read(inner);
    if (outermost) _inVariant = false;
    return value;
  }

  /// Where the array ends whose elements come next.
  std::size_t enterArray(char element) {
    const auto size = _bytes.number<std::uint32_t>();
    if (size > kMaximumArrayBytes) throwMalformed("an array that is too long");
    _bytes.align(alignmentOf(element));
    return _bytes.position() + size;
  }

  bool isWithin(std::size_t end) const {
    if (_bytes.position() > end) throwMalformed("an element that reaches beyond its array");
    return _bytes.position() < end;
  }

  Value readAnyArray(std::string_view element) {
    const Level level(_depth);
    const std::size_t end = enterArray(element[0]);
    if (element[0] == 'y') return Value(Data(std::string(_bytes.bytes(end - _bytes.position()))));
    if (element[0] == '{') return readDictionary(element, end);
    std::vector<Value> values;
    while (isWithin(end)) values.push_back(read(element));
    return Value(Array(std::move(values)));
  }

  Value readDictionary(std::string_view entry, std::size_t end) {
    constexpr std::size_t kUsualSize = 12;
    if (entry[1] != 's') throwMalformed("a dictionary's keys must be strings");
    const std::string_view valueType = entry.substr(2, entry.size() - 3);
    std::vector<Dictionary::Entry> entries;
    if (isWithin(end)) entries.reserve(kUsualSize);
    while (isWithin(end)) {
      _bytes.align(alignmentOf('{'));
      const std::string_view key = _bytes.text();
      entries.push_back({std::string(key), read(valueType)});
    }
    return Value(Dictionary(std::move(entries)));
  }

  Value readDate(std::string_view type) {
    if (type != "(d)") throwMalformed("a structure other than (d) is no value");
    return Value(Date{_bytes.number<double>()});
  }

  Value readDescriptor() {
    if (_inVariant) throwMalformed("a descriptor is no value");
    const auto index = _bytes.number<std::uint32_t>();
    if (index >= _came.size() || !_came[index]) throwMalformed("a descriptor that did not come");
    _used.push_back(std::move(_came[index]));
    return {};
  }

  ByteReader _bytes;
  std::vector<FileDescriptor> _came;
  std::vector<FileDescriptor>& _used;
  std::size_t _valuesLeft = kMaximumValuesInMessage;
  int _depth = 0;
  bool _inVariant = false;
};

}  // namespace

ReadValues readBody(std::string_view body, std::endian order, std::string_view signature,
                    std::vector<FileDescriptor> descriptors) {
  constexpr std::size_t kUsualArguments = 4;
  ReadValues result;
  result.values.reserve(kUsualArguments);
  try {
    Reader reader(body, order, std::move(descriptors), result.descriptors);
    while (!signature.empty()) {
      const auto length = completeTypeLength(signature);
      result.values.push_back(reader.read(signature.substr(0, length)));
      signature.remove_prefix(length);
    }
    if (!reader.isAtEnd()) result.problem = "More follows than the arguments";
  } catch (const Malformed& malformed) {
    result.problem = fmt::format("Argument {}: {}", result.values.size() + 1, malformed.reason);
  }
  return result;
}

}  // namespace tallyd::platform::dbus
