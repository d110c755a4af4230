// D-Bus's marshalled form, read from the front to the back (D-Bus Specification, "Marshaling (Wire Format)").
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace tallyd::platform::dbus {

/// What was read is no D-Bus, or says what it must not say. Thrown by the readers of this folder.
struct Malformed {
  std::string reason;
};
/// Throws it; by itself so that the readers stay small where all is well.
[[noreturn]] void throwMalformed(const char* reason);

/// A place in marshalled bytes. Everything is checked against their end; what does not fit throws Malformed.
///
/// Texts are views of the bytes. Boundaries count from the first byte, which must be on a boundary of 8 in
/// its message.
class ByteReader {
 public:
  ByteReader(std::string_view bytes, std::endian order)
      : _bytes(bytes), _swaps(order != std::endian::native) {}

  [[nodiscard]] std::size_t position() const { return _position; }
  [[nodiscard]] bool isAtEnd() const { return _position == _bytes.size(); }

  /// Passes over padding, which must be zeros.
  void align(std::size_t boundary) {
    while ((_position & (boundary - 1)) != 0) {
      if (bytes(1)[0] != '\0') throwMalformed("padding that is not zero");
    }
  }

  std::string_view bytes(std::size_t count) {
    if (count > _bytes.size() - _position) throwMalformed("cut off");
    const auto taken = _bytes.substr(_position, count);
    _position += count;
    return taken;
  }

  /// An integer or a real, on its boundary.
  template <class T>
  T number() {
    align(sizeof(T));
    const auto taken = bytes(sizeof(T));
    T value;
    if (!_swaps) {
      std::memcpy(&value, taken.data(), sizeof(T));
    } else {
      char swapped[sizeof(T)];
      for (std::size_t i = 0; i < sizeof(T); ++i) swapped[i] = taken[sizeof(T) - 1 - i];
      std::memcpy(&value, swapped, sizeof(T));
    }
    return value;
  }

  /// "s" and "o": UTF-8 without a NUL.
  std::string_view text() { return terminated(number<std::uint32_t>()); }
  /// "g"; it is not checked.
  std::string_view signature() { return terminatedBytes(number<std::uint8_t>()); }

 private:
  std::string_view terminatedBytes(std::size_t length) {
    const auto content = bytes(length);
    if (bytes(1)[0] != '\0') throwMalformed("a text without its end");
    return content;
  }
  std::string_view terminated(std::size_t length) {
    const auto content = terminatedBytes(length);
    if (!isCarriableText(content)) throwMalformed("a text that is no UTF-8, or holds a NUL");
    return content;
  }
  static bool isCarriableText(std::string_view text);

  std::string_view _bytes;
  std::size_t _position = 0;
  bool _swaps;
};

}  // namespace tallyd::platform::dbus
