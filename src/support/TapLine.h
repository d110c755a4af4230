// One line of the live tap: a JSON object that is built field by field.
#pragma once

#include <string>
#include <string_view>

#include "platform/Clock.h"
#include "platform/Value.h"

namespace tallyd {

/// {"time": seconds since 1970, "kind": KIND, …} and a line feed. Threading: one thread at a time.
class TapLine {
 public:
  TapLine(std::string_view kind, platform::TimePoint time);

  /// What JSON can't hold (data, dates, infinities) is shown as the value's description.
  TapLine& add(std::string_view key, const platform::Value& value);
  /// @param json  one JSON value without line feeds; taken as it stands.
  TapLine& addJSON(std::string_view key, std::string_view json);
  [[nodiscard]] std::string finished() &&;

 private:
  std::string _text;
};

}  // namespace tallyd
