#include "SdBusValueReader.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>

#include "platform/dbus/Signature.h"

namespace tallyd::platform {

namespace {

/// Thrown within this file only, so that the reading functions can return values.
struct Unreadable {
  std::string reason;
};

class Reader {
 public:
  Reader(sd_bus_message* message, std::vector<FileDescriptor>& descriptors)
      : _message(message), _descriptors(descriptors) {}

  /// @param type  one complete type.
  Value read(const std::string& type) {
    if (_valuesLeft-- == 0) throw Unreadable{"too many values"};
    switch (type[0]) {
      case SD_BUS_TYPE_VARIANT:
        return readVariant();
      case SD_BUS_TYPE_ARRAY:
        return readAnyArray(type.substr(1));
      case SD_BUS_TYPE_STRUCT_BEGIN:
        return readDate(type);
      case SD_BUS_TYPE_STRING:
        return Value(std::string_view(basic<const char*>(SD_BUS_TYPE_STRING)));
      case SD_BUS_TYPE_SIGNATURE:
        if (*basic<const char*>(SD_BUS_TYPE_SIGNATURE) != '\0') throw Unreadable{"a signature is no value"};
        return {};
      case SD_BUS_TYPE_BOOLEAN:
        return Value(basic<int>(SD_BUS_TYPE_BOOLEAN) != 0);
      case SD_BUS_TYPE_DOUBLE:
        return Value(basic<double>(SD_BUS_TYPE_DOUBLE));
      case SD_BUS_TYPE_UNIX_FD:
        return readDescriptor();
      default:
        return readInteger(type[0]);
    }
  }

 private:
  /// Counts a level of nesting for as long as it lives.
  class Level {
   public:
    explicit Level(int& depth) : _depth(depth) {
      if (++_depth > dbus::kMaximumContainerDepth) throw Unreadable{"nested too deeply"};
    }
    ~Level() { --_depth; }
    Level(const Level&) = delete;
    Level& operator=(const Level&) = delete;

   private:
    int& _depth;
  };

  static int check(int result) {
    if (result < 0) throw Unreadable{"malformed"};
    return result;
  }

  template <class T>
  T basic(char type) {
    T value{};
    if (check(sd_bus_message_read_basic(_message, type, &value)) == 0) throw Unreadable{"malformed"};
    return value;
  }

  Value readInteger(char type) {
    switch (type) {
      case SD_BUS_TYPE_BYTE:
        return Value(std::int64_t{basic<std::uint8_t>(type)});
      case SD_BUS_TYPE_INT16:
        return Value(std::int64_t{basic<std::int16_t>(type)});
      case SD_BUS_TYPE_UINT16:
        return Value(std::int64_t{basic<std::uint16_t>(type)});
      case SD_BUS_TYPE_INT32:
        return Value(std::int64_t{basic<std::int32_t>(type)});
      case SD_BUS_TYPE_UINT32:
        return Value(std::int64_t{basic<std::uint32_t>(type)});
      case SD_BUS_TYPE_INT64:
        return Value(basic<std::int64_t>(type));
      case SD_BUS_TYPE_UINT64:
        return Value(basic<std::uint64_t>(type));
      default:
        throw Unreadable{fmt::format("type '{}' is no value", type)};
    }
  }

  Value readVariant() {
    const Level level(_depth);
    char type = 0;
    const char* contents = nullptr;
    if (check(sd_bus_message_peek_type(_message, &type, &contents)) == 0 || type != SD_BUS_TYPE_VARIANT) {
      throw Unreadable{"malformed"};
    }
    const std::string inner = contents;  // The library's copy goes with the next look.
    check(sd_bus_message_enter_container(_message, SD_BUS_TYPE_VARIANT, inner.c_str()));
    const bool outermost = !_inVariant;
    _inVariant = true;
    Value value = read(inner);
    if (outermost) _inVariant = false;
    check(sd_bus_message_exit_container(_message));
    return value;
  }

  Value readAnyArray(const std::string& element) {
    const Level level(_depth);
    if (element[0] == SD_BUS_TYPE_BYTE) return readData();
    if (element[0] == SD_BUS_TYPE_DICT_ENTRY_BEGIN) return readDictionary(element);
    std::vector<Value> values;
    check(sd_bus_message_enter_container(_message, SD_BUS_TYPE_ARRAY, element.c_str()));
    while (check(sd_bus_message_at_end(_message, 0)) == 0) values.push_back(read(element));
    check(sd_bus_message_exit_container(_message));
    return Value(Array(std::move(values)));
  }

  Value readData() {
    const void* bytes = nullptr;
    std::size_t size = 0;
    check(sd_bus_message_read_array(_message, SD_BUS_TYPE_BYTE, &bytes, &size));
    if (size == 0) return Value(Data());
    return Value(Data(std::string(static_cast<const char*>(bytes), size)));
  }

  Value readDictionary(const std::string& entry) {
    if (entry[1] != SD_BUS_TYPE_STRING) throw Unreadable{"a dictionary's keys must be strings"};
    const std::string contents = entry.substr(1, entry.size() - 2);
    const std::string valueType = contents.substr(1);
    std::vector<Dictionary::Entry> entries;
    check(sd_bus_message_enter_container(_message, SD_BUS_TYPE_ARRAY, entry.c_str()));
    while (check(sd_bus_message_enter_container(_message, SD_BUS_TYPE_DICT_ENTRY, contents.c_str())) > 0) {
      std::string key = basic<const char*>(SD_BUS_TYPE_STRING);
      entries.push_back({std::move(key), read(valueType)});
      check(sd_bus_message_exit_container(_message));
    }
    check(sd_bus_message_exit_container(_message));
    return Value(Dictionary(std::move(entries)));
  }

  Value readDate(const std::string& type) {
    if (type != "(d)") throw Unreadable{"a structure other than (d) is no value"};
    check(sd_bus_message_enter_container(_message, SD_BUS_TYPE_STRUCT, "d"));
    const Date date{basic<double>(SD_BUS_TYPE_DOUBLE)};
    check(sd_bus_message_exit_container(_message));
    return Value(date);
  }

  Value readDescriptor() {
    if (_inVariant) throw Unreadable{"a descriptor is no value"};
    const int descriptor = basic<int>(SD_BUS_TYPE_UNIX_FD);  // The message's own.
    FileDescriptor copy(::fcntl(descriptor, F_DUPFD_CLOEXEC, 3));
    if (!copy) throw Unreadable{fmt::format("a descriptor cannot be kept: {}", std::strerror(errno))};
    _descriptors.push_back(std::move(copy));
    return {};
  }

  sd_bus_message* const _message;
  std::vector<FileDescriptor>& _descriptors;
  std::size_t _valuesLeft = dbus::kMaximumValuesInMessage;
  int _depth = 0;
  bool _inVariant = false;
};

}  // namespace

dbus::ReadValues readValues(sd_bus_message* message, std::string_view signature) {
  dbus::ReadValues result;
  try {
    Reader reader(message, result.descriptors);
    while (!signature.empty()) {
      const auto length = dbus::completeTypeLength(signature);
      result.values.push_back(reader.read(std::string(signature.substr(0, length))));
      signature.remove_prefix(length);
    }
  } catch (const Unreadable& unreadable) {
    result.problem = fmt::format("Argument {}: {}", result.values.size() + 1, unreadable.reason);
  }
  return result;
}

}  // namespace tallyd::platform
