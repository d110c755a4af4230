// Values as JSON text (RFC 8259) and back.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::platform {

/// A JSON text in the making: compact, with the separators that what comes next needs.
///
/// Text that is not UTF-8 gets the replacement character. Threading: one thread at a time.
class JSONText {
 public:
  JSONText() = default;
  /// @param bytes  how long the text is expected to become.
  explicit JSONText(std::size_t bytes) { grow(bytes); }

  void startObject() { start('{'); }
  void endObject() { end('}'); }
  void startArray() { start('['); }
  void endArray() { end(']'); }
  void key(std::string_view name);  ///< A value must follow.
  void text(std::string_view value);
  /// False when the value holds a date, data, a NaN or an infinity, or is nested too deeply; the text is of
  /// no use then.
  [[nodiscard]] bool value(const Value& value);
  /// A value, or a member with its key, that is JSON already.
  void written(std::string_view json);

  [[nodiscard]] std::string_view view() const { return {_room.get(), _length}; }
  [[nodiscard]] std::string string() const { return std::string(view()); }

 private:
  class Writer;

  void start(char bracket);
  void end(char bracket);
  void separate();
  void quote(std::string_view text);
  [[nodiscard]] std::size_t appendSpecial(std::string_view text);
  void append(std::string_view text);
  void append(char byte);
  /// Where `bytes` more may be written; they count once `_length` does.
  [[nodiscard]] char* roomFor(std::size_t bytes) {
    if (_size - _length < bytes) grow(_length + bytes);
    return _room.get() + _length;
  }
  void grow(std::size_t atLeast);

  std::unique_ptr<char[]> _room;  ///< The text, and behind it what is still free.
  std::size_t _size = 0;          ///< Of both.
  std::size_t _length = 0;
  bool _needsComma = false;
};

/// Compact JSON; nothing when the value holds a date, data, a NaN or an infinity. Booleans are true and
/// false; text that is not UTF-8 gets the replacement character.
[[nodiscard]] std::optional<std::string> jsonFromValue(const Value& value);

struct JSONResult {
  std::optional<Value> value;
  std::string error;  ///< What is wrong and at which byte; empty when there is a value.
};

/// Reads one JSON text. Nesting is bounded as property lists' is.
[[nodiscard]] JSONResult valueFromJSON(std::string_view text);

}  // namespace tallyd::platform
