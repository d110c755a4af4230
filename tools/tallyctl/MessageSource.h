// Messages from a file of JSON lines.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "tallyctl/Input.h"
#include "tallyctl/LineReader.h"
#include "tallyctl/Message.h"

namespace tallyd::tallyctl {

/// Reads one message after the other; the file may be of any length, or a pipe.
class MessageSource {
 public:
  struct Fault {
    std::string place;  ///< "FILE:LINE".
    std::string text;   ///< What is wrong.
  };

  /// Opens `path`; "-" is `standardInput`, which is borrowed. Throws std::system_error that names the file,
  /// for a folder too.
  MessageSource(const std::string& path, int standardInput);

  /// The next message, or what is wrong with the next line, which is then passed over; nothing at the end.
  /// Throws std::system_error that names file and line when the file cannot be read on.
  std::optional<std::variant<Message, Fault>> next();

  [[nodiscard]] std::uint64_t lineNumber() const {
    return _lines.lineNumber();
  }  ///< Of what next() gave last.
  /// "FILE:LINE".
  [[nodiscard]] std::string placeOf(std::uint64_t lineNumber) const;
  /// How much of the file has been read, from 0 to 1; nothing when its length is not known.
  [[nodiscard]] std::optional<double> share() const;

 private:
  LineReader::Status nextLine();

  const Input _input;
  LineReader _lines;
  std::string _line;
};

}  // namespace tallyd::tallyctl
