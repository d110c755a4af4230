#include "station/Files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "platform/FileDescriptor.h"

namespace tallyd::station {

namespace {

using platform::FileDescriptor;

[[noreturn]] void fail(const std::filesystem::path& path) {
  throw std::system_error(errno, std::generic_category(), path.string());
}

void writeAll(int descriptor, std::string_view bytes, const std::filesystem::path& path) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(descriptor, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(path);
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

}  // namespace

std::string readFile(const std::filesystem::path& path) {
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) fail(path);
  std::string bytes;
  std::array<char, 16384> buffer;
  while (true) {
    const ssize_t count = ::read(file.get(), buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(path);
    if (count == 0) return bytes;
    bytes.append(buffer.data(), static_cast<std::size_t>(count));
  }
}

void replaceFile(const std::filesystem::path& path, std::string_view bytes, mode_t mode) {
  std::string temporary = path.string() + ".XXXXXX";
  const FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
  if (!file) fail(path);
  try {
    if (::fchmod(file.get(), mode) != 0) fail(path);
    writeAll(file.get(), bytes, path);
    if (::rename(temporary.c_str(), path.c_str()) != 0) fail(path);
  } catch (...) {
    ::unlink(temporary.c_str());
    throw;
  }
}

void appendToFile(const std::filesystem::path& path, std::string_view bytes) {
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
  if (!file) fail(path);
  writeAll(file.get(), bytes, path);
}

}  // namespace tallyd::station
