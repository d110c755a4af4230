#include "platform/ipc/ValueWriter.h"

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include <algorithm>
#include <cstring>
#include <limits>

#include "platform/UTF8.h"
#include "platform/ipc/ValueReader.h"

namespace tallyd::platform {

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
    wellFormed.replace(nul, 1, "\xEF\xBF\xBD");
  }
  return wellFormed;
}

class Writer {
 public:
  Writer(sd_bus_message* message, const std::vector<FileDescriptor>& descriptors)
      : _message(message), _descriptors(descriptors) {}

  /// @param type  one complete type.
  void append(const std::string& type, const Value& value) {
    switch (type[0]) {
      case SD_BUS_TYPE_VARIANT:
        return appendVariant(value);
      case SD_BUS_TYPE_ARRAY:
        return appendAnyArray(type.substr(1), value);
      case SD_BUS_TYPE_STRUCT_BEGIN:
        return type == "(d)" && value.date() ? appendDate(*value.date()) : misfit(type);
      case SD_BUS_TYPE_STRING:
        return value.string() ? appendText(*value.string()) : misfit(type);
      case SD_BUS_TYPE_SIGNATURE:
        return value.isNull() ? appendNull() : misfit(type);
      case SD_BUS_TYPE_BOOLEAN:
        return value.isBoolean() ? appendBasic<int>(SD_BUS_TYPE_BOOLEAN, value.booleanValue()) : misfit(type);
      case SD_BUS_TYPE_DOUBLE:
        return value.isReal() ? appendBasic<double>(SD_BUS_TYPE_DOUBLE, *value.realValue()) : misfit(type);
      case SD_BUS_TYPE_UNIX_FD:
        if (_descriptorsUsed == _descriptors.size()) misfit(type);
        return appendBasic<int>(SD_BUS_TYPE_UNIX_FD, _descriptors[_descriptorsUsed++].get());
      default:
        return value.isInteger() ? appendInteger(type, value) : misfit(type);
    }
  }

 private:
  /// Opens a container and, at the end of the scope, closes it.
  class Container {
   public:
    Container(Writer& writer, char type, const char* contents) : _writer(writer) {
      if (++_writer._depth > kMaximumContainerDepth) throw Unwritable{"nested too deeply"};
      check(sd_bus_message_open_container(_writer._message, type, contents));
    }
    ~Container() {
      --_writer._depth;
      sd_bus_message_close_container(_writer._message);
    }
    Container(const Container&) = delete;
    Container& operator=(const Container&) = delete;

   private:
    Writer& _writer;
  };

  [[noreturn]] static void misfit(const std::string& type) {
    throw Unwritable{fmt::format("the value does not fit the type \"{}\"", type)};
  }

  static void check(int result) {
    if (result < 0) throw Unwritable{std::strerror(-result)};
  }

  template <class T>
  void appendBasic(char type, T value) {
    check(sd_bus_message_append_basic(_message, type, &value));
  }

  template <class T>
  void appendNarrow(const std::string& type, const Value& value) {
    const auto number = *value.integerValue();
    if (number < std::numeric_limits<T>::min() || number > std::numeric_limits<T>::max()) misfit(type);
    appendBasic<T>(type[0], static_cast<T>(number));
  }

  void appendInteger(const std::string& type, const Value& value) {
    const bool aboveSigned = value.visit(
        [](const auto& number) { return std::is_same_v<std::decay_t<decltype(number)>, std::uint64_t>; });
    if (type[0] == SD_BUS_TYPE_UINT64) {
      if (!aboveSigned && *value.integerValue() < 0) misfit(type);
      return appendBasic<std::uint64_t>(type[0], static_cast<std::uint64_t>(*value.integerValue()));
    }
    if (aboveSigned) misfit(type);
    switch (type[0]) {
      case SD_BUS_TYPE_BYTE:
        return appendNarrow<std::uint8_t>(type, value);
      case SD_BUS_TYPE_INT16:
        return appendNarrow<std::int16_t>(type, value);
      case SD_BUS_TYPE_UINT16:
        return appendNarrow<std::uint16_t>(type, value);
      case SD_BUS_TYPE_INT32:
        return appendNarrow<std::int32_t>(type, value);
      case SD_BUS_TYPE_UINT32:
        return appendNarrow<std::uint32_t>(type, value);
      case SD_BUS_TYPE_INT64:
        return appendBasic<std::int64_t>(type[0], *value.integerValue());
      default:
        misfit(type);
    }
  }

  void appendText(std::string_view text) {
    if (!isPlainText(text)) {
      const std::string carriable = carriableText(text);
      return appendCarriable(carriable);
    }
    appendCarriable(text);
  }

  void appendCarriable(std::string_view text) {
    char* space = nullptr;
    check(sd_bus_message_append_string_space(_message, text.size(), &space));
    std::copy(text.begin(), text.end(), space);
  }

  void appendNull() { check(sd_bus_message_append_basic(_message, SD_BUS_TYPE_SIGNATURE, "")); }

  void appendDate(Date date) {
    const Container structure(*this, SD_BUS_TYPE_STRUCT, "d");
    appendBasic<double>(SD_BUS_TYPE_DOUBLE, date.secondsSince1970);
  }

  void appendAnyArray(const std::string& element, const Value& value) {
    if (element == "y") {
      if (!value.data()) misfit("ay");
      const auto bytes = value.data()->bytes();
      return check(sd_bus_message_append_array(_message, SD_BUS_TYPE_BYTE, bytes.data(), bytes.size()));
    }
    if (element[0] == SD_BUS_TYPE_DICT_ENTRY_BEGIN) {
      if (!value.dictionary() || element[1] != SD_BUS_TYPE_STRING) misfit("a" + element);
      return appendDictionary(element, *value.dictionary());
    }
    if (!value.array()) misfit("a" + element);
    const Container array(*this, SD_BUS_TYPE_ARRAY, element.c_str());
    for (const Value& each : *value.array()) append(element, each);
  }

  void appendDictionary(const std::string& entry, const Dictionary& dictionary) {
    const std::string contents = entry.substr(1, entry.size() - 2);
    const std::string valueType = contents.substr(1);
    const Container array(*this, SD_BUS_TYPE_ARRAY, entry.c_str());
    for (const auto& [key, value] : dictionary) {
      const Container pair(*this, SD_BUS_TYPE_DICT_ENTRY, contents.c_str());
      appendText(key);
      append(valueType, value);
    }
  }

  void appendVariant(const Value& value) {
    const std::string type = variantType(value);
    const Container variant(*this, SD_BUS_TYPE_VARIANT, type.c_str());
    append(type, value);
  }

  static std::string variantType(const Value& value) {
    struct Type {
      const char* operator()(std::monostate) const { return "g"; }
      const char* operator()(bool) const { return "b"; }
      const char* operator()(std::int64_t) const { return "x"; }
      const char* operator()(std::uint64_t) const { return "t"; }
      const char* operator()(double) const { return "d"; }
      const char* operator()(std::string_view) const { return "s"; }
      const char* operator()(Date) const { return "(d)"; }
      const char* operator()(const Data&) const { return "ay"; }
      const char* operator()(const Array&) const { return "av"; }
      const char* operator()(const Dictionary&) const { return "a{sv}"; }
    };
    return value.visit(Type());
  }

  sd_bus_message* const _message;
  const std::vector<FileDescriptor>& _descriptors;
  std::size_t _descriptorsUsed = 0;
  int _depth = 0;
};

}  // namespace

std::optional<std::string> appendValues(sd_bus_message* message, std::string_view signature,
                                        const std::vector<Value>& values,
                                        const std::vector<FileDescriptor>& descriptors) {
  try {
    Writer writer(message, descriptors);
    for (const Value& value : values) {
      const auto length = completeTypeLength(signature);
      if (length == 0) return "too many values";
      writer.append(std::string(signature.substr(0, length)), value);
      signature.remove_prefix(length);
    }
  } catch (const Unwritable& unwritable) {
    return unwritable.reason;
  }
  if (!signature.empty()) return "too few values";
  return std::nullopt;
}

}  // namespace tallyd::platform
