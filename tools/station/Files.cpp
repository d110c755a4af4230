#include "station/Files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "platform/AppendWhole.h"
#include "platform/FileDescriptor.h"

namespace tallyd::station {

namespace {

using platform::FileDescriptor;

[[noreturn]] void fail(const std::filesystem::path& path) {
  throw std::system_error(errno, std::generic_category(), path.string());
}

std::system_error notRegular(const std::filesystem::path& path) {
  return {EINVAL, std::generic_category(), path.string() + " is not a regular file"};
}

/// Opens without waiting and refuses whatever is no regular file.
FileDescriptor openRegular(const std::filesystem::path& path, int flags) {
  FileDescriptor file(::open(path.c_str(), flags | O_NONBLOCK | O_CLOEXEC, 0644));
  struct stat status {};
  // A pipe that nobody reads can't even be opened for writing.
  if (!file && errno == ENXIO) throw notRegular(path);
  if (!file || ::fstat(file.get(), &status) != 0) fail(path);
  if (!S_ISREG(status.st_mode)) throw notRegular(path);
  return file;
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
  const FileDescriptor file = openRegular(path, O_RDONLY);
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
  const FileDescriptor file = openRegular(path, O_WRONLY | O_CREAT | O_APPEND);
  if (const auto error = platform::appendWhole(file.get(), bytes))
    throw std::system_error(error, path.string());
}

}  // namespace tallyd::station
