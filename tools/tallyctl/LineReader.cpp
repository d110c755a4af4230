#include "tallyctl/LineReader.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

namespace tallyd::tallyctl {

namespace {
constexpr std::size_t kBufferBytes = std::size_t{64} << 10;
}

LineReader::LineReader(int descriptor, std::size_t maximumLineBytes)
    : _descriptor(descriptor), _maximumLineBytes(maximumLineBytes), _buffer(kBufferBytes) {}

LineReader::Status LineReader::next(std::string& line) {
  line.clear();
  bool started = false;
  bool tooLong = false;
  for (bool ended = false; !ended && (_position < _end || fill());) {
    started = true;
    const char* const from = _buffer.data() + _position;
    const char* const to = _buffer.data() + _end;
    const char* const feed = std::find(from, to, '\n');
    ended = feed != to;
    const auto length = static_cast<std::size_t>(feed - from);
    tooLong = tooLong || length > _maximumLineBytes - line.size();
    if (!tooLong) line.append(from, length);
    _position += length + (ended ? 1 : 0);
  }
  if (!started) return Status::End;
  ++_lineNumber;
  return tooLong ? Status::TooLong : Status::Line;
}

bool LineReader::fill() {
  ssize_t count = 0;
  do {
    count = ::read(_descriptor, _buffer.data(), _buffer.size());
  } while (count < 0 && errno == EINTR);
  if (count < 0) throw std::system_error(errno, std::generic_category());
  _position = 0;
  _end = static_cast<std::size_t>(count);
  _bytesRead += static_cast<std::uint64_t>(count);
  return count > 0;
}

}  // namespace tallyd::tallyctl
