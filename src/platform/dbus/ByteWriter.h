// D-Bus's marshalled form, written (D-Bus Specification, "Marshaling (Wire Format)").
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace tallyd::platform::dbus {

/// Appends in this machine's byte order to a text that it borrows. Boundaries count from where it starts.
class ByteWriter {
 public:
  explicit ByteWriter(std::string& out) : _out(out), _start(out.size()) {}

  [[nodiscard]] std::size_t position() const { return _out.size() - _start; }

  void align(std::size_t boundary) {
    const std::size_t over = position() & (boundary - 1);
    if (over != 0) _out.append(boundary - over, '\0');
  }
  void bytes(std::string_view bytes) { _out += bytes; }

  /// An integer or a real, on its boundary.
  template <class T>
  void number(T value) {
    align(sizeof(T));
    char raw[sizeof(T)];
    std::memcpy(raw, &value, sizeof(T));
    _out.append(raw, sizeof(T));
  }

  /// "s" and "o", as it is: the caller has UTF-8 without a NUL.
  void text(std::string_view text) {
    number(static_cast<std::uint32_t>(text.size()));
    _out += text;
    _out += '\0';
  }
  /// "g"; at most 255 bytes.
  void signature(std::string_view signature) {
    _out += static_cast<char>(signature.size());
    _out += signature;
    _out += '\0';
  }

  /// Room for a number that is known later.
  [[nodiscard]] std::size_t reserveNumber() {
    number(std::uint32_t{0});
    return position() - sizeof(std::uint32_t);
  }
  void fillIn(std::size_t place, std::size_t value) {
    const auto number = static_cast<std::uint32_t>(value);
    std::memcpy(_out.data() + _start + place, &number, sizeof number);
  }

 private:
  std::string& _out;
  const std::size_t _start;
};

}  // namespace tallyd::platform::dbus
