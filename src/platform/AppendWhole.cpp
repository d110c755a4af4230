#include "platform/AppendWhole.h"

#include <sys/types.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>

namespace tallyd::platform {

namespace {

std::error_code lastError() { return {errno, std::generic_category()}; }

/// Shortens the file by what was just written to its end.
std::error_code takeBack(int file, std::size_t bytes) {
  const off_t end = ::lseek(file, 0, SEEK_CUR);
  if (end < 0 || ::ftruncate(file, end - static_cast<off_t>(bytes)) != 0) return lastError();
  return {};
}

}  // namespace

std::error_code appendWhole(int file, std::string_view text) {
  std::size_t written = 0;
  while (written < text.size()) {
    const ssize_t count = ::write(file, text.data() + written, text.size() - written);
    if (count >= 0) {
      written += static_cast<std::size_t>(count);
    } else if (errno != EINTR) {
      const std::error_code reason = lastError();
      const std::error_code stays = written > 0 ? takeBack(file, written) : std::error_code();
      return stays ? stays : reason;
    }
  }
  return {};
}

}  // namespace tallyd::platform
