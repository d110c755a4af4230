// Lines from a descriptor, each at most so long.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tallyd::tallyctl {

/// Reads a descriptor line by line. Holds one line and one buffer, however long the input is.
class LineReader {
 public:
  /// Far above any message that the daemon's backends take, and within what one call may carry.
  static constexpr std::size_t kMaximumLineBytes = std::size_t{16} << 20;

  enum class Status {
    Line,
    TooLong,  ///< The line was passed over.
    End,
  };

  /// Borrows the descriptor.
  explicit LineReader(int descriptor, std::size_t maximumLineBytes = kMaximumLineBytes);

  /// Puts the next line into `line`, without its line feed; the last one needs none. Waits for input. Throws
  /// std::system_error when the descriptor cannot be read.
  Status next(std::string& line);

  [[nodiscard]] std::uint64_t lineNumber() const { return _lineNumber; }  ///< Of the last line; from 1.
  [[nodiscard]] std::uint64_t bytesRead() const { return _bytesRead; }

 private:
  bool fill();

  const int _descriptor;
  const std::size_t _maximumLineBytes;
  std::vector<char> _buffer;
  std::size_t _position = 0;
  std::size_t _end = 0;
  std::uint64_t _lineNumber = 0;
  std::uint64_t _bytesRead = 0;
};

}  // namespace tallyd::tallyctl
