#include "station/DirectoryLock.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <stdexcept>
#include <string>
#include <system_error>

namespace tallyd::station {

namespace {

/// The process ID that the holder left in the file; it may not have come to writing it.
std::string holderIn(int file) {
  char text[32];
  const ssize_t count = ::pread(file, text, sizeof text, 0);
  std::string holder(text, count > 0 ? static_cast<std::size_t>(count) : 0);
  holder.erase(std::min(holder.find('\n'), holder.size()));
  const bool isNumber = !holder.empty() && holder.find_first_not_of("0123456789") == std::string::npos;
  return isNumber ? fmt::format(", process {},", holder) : "";
}

}  // namespace

DirectoryLock::DirectoryLock(const std::filesystem::path& directory) {
  std::filesystem::create_directories(directory);
  const std::filesystem::path path = directory / "station.lock";
  _file = platform::FileDescriptor(::open(path.c_str(), O_RDWR | O_CREAT | O_NONBLOCK | O_CLOEXEC, 0644));
  if (!_file) throw std::system_error(errno, std::generic_category(), path.string());
  if (::flock(_file.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK) throw std::system_error(errno, std::generic_category(), path.string());
    throw std::runtime_error(fmt::format("another tally-station{} uses {}: it holds the lock {}",
                                         holderIn(_file.get()), directory.string(), path.string()));
  }
  const std::string holder = fmt::format("{}\n", ::getpid());
  if (::ftruncate(_file.get(), 0) != 0 ||
      ::pwrite(_file.get(), holder.data(), holder.size(), 0) != static_cast<ssize_t>(holder.size())) {
    throw std::system_error(errno, std::generic_category(), path.string());
  }
}

}  // namespace tallyd::station
