#include "platform/system/SystemRandomness.h"

#include <sys/random.h>

#include <cerrno>
#include <system_error>

namespace tallyd::platform {

double SystemRandomness::drand48() {
  const std::lock_guard lock(_mutex);
  double draw = 0;
  ::drand48_r(&_generator, &draw);
  return draw;
}

UUIDBytes SystemRandomness::uuid() {
  UUIDBytes bytes{};
  // Requests of up to 256 bytes are answered whole; only a signal before the first byte can interrupt them.
  while (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
    if (errno != EINTR) throw std::system_error(errno, std::generic_category(), "getrandom");
  }
  bytes[6] = static_cast<std::uint8_t>((bytes[6] & 0x0F) | 0x40);  // Version 4.
  bytes[8] = static_cast<std::uint8_t>((bytes[8] & 0x3F) | 0x80);  // The variant of RFC 4122.
  return bytes;
}

}  // namespace tallyd::platform
