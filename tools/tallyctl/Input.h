// A file that the tool reads.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/FileDescriptor.h"

namespace tallyd::tallyctl {

/// An open file, or the standard input. Whatever fails throws std::system_error that names it.
class Input {
 public:
  /// Opens `path`; "-" is `standardInput`, which is borrowed. A folder is refused here, before anything is
  /// done with what was to be read.
  Input(const std::string& path, int standardInput);

  [[nodiscard]] int descriptor() const { return _file ? _file.get() : _standardInput; }
  [[nodiscard]] const std::string& name() const { return _name; }           ///< "standard input" for "-".
  [[nodiscard]] std::uint64_t lengthBytes() const { return _lengthBytes; }  ///< 0 when not known.

  /// Everything up to the end; throws std::system_error with EFBIG when that is more than `maximumBytes`.
  [[nodiscard]] std::string readWhole(std::size_t maximumBytes) const;

 private:
  const std::string _name;
  const platform::FileDescriptor _file;  ///< Empty for the standard input.
  const int _standardInput;
  std::uint64_t _lengthBytes = 0;
};

}  // namespace tallyd::tallyctl
